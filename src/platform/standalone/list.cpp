// The list of strings.
#include "platform/list.h"

#include <algorithm>
#include <cstring>
#include <memory>

#include "platform/standalone/container.h"
#include "platform/standalone/error_code.h"

ALIBSZLIST* ALIBCSzListAlloc(int size) try {
  if (size < 0) {
    platform::FailForArgument();
    return nullptr;
  }
  auto list = std::make_unique<ALIBSZLIST>();
  list->texts.reserve(static_cast<size_t>(size));
  return list.release();
} catch (...) {
  platform::FailForException();
  return nullptr;
}

void ALIBCSzListFree(ALIBSZLIST* list) {
  delete list;
}

void ALIBCSzListRemoveAll(ALIBSZLIST* list) {
  if (list != nullptr) {
    list->texts.clear();
  }
}

int ALIBCSzListPush(ALIBSZLIST** list, const char* text) try {
  if (list == nullptr || *list == nullptr || text == nullptr) {
    return platform::FailForArgument();
  }
  (*list)->texts.emplace_back(text);
  return static_cast<int>((*list)->texts.size());
} catch (...) {
  return platform::FailForException();
}

int ALIBCSzListFind(const ALIBSZLIST* list, const char* text) {
  if (list == nullptr || text == nullptr) {
    return platform::FailForArgument();
  }
  const auto found = std::find(list->texts.begin(), list->texts.end(), text);
  return found == list->texts.end() ? -1 : static_cast<int>(found - list->texts.begin());
}

int ALIBCSzListSize(const ALIBSZLIST* list) {
  return list == nullptr ? 0 : static_cast<int>(list->texts.size());
}

const char* ALIBCSzListGet(const ALIBSZLIST* list, int index) {
  if (index < 0 || index >= ALIBCSzListSize(list)) {
    return nullptr;
  }
  return list->texts[static_cast<size_t>(index)].c_str();
}

int ALIBCStrTok(const char* text, const char* separators, ALIBSZLIST** list) try {
  if (text == nullptr || separators == nullptr || list == nullptr || *list == nullptr) {
    return platform::FailForArgument();
  }
  std::vector<std::string> pieces;
  for (text += strspn(text, separators); *text != '\0'; text += strspn(text, separators)) {
    const size_t length = strcspn(text, separators);
    pieces.emplace_back(text, length);
    text += length;
  }
  std::vector<std::string>& texts = (*list)->texts;
  texts.insert(texts.end(), pieces.begin(), pieces.end());
  return static_cast<int>(pieces.size());
} catch (...) {
  return platform::FailForException();
}
