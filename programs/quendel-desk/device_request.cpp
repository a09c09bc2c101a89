// What a device asks for, as the path of its request says.
#include "device_request.h"

#include <algorithm>
#include <vector>

#include "json.h"

namespace quendeldesk {
namespace {

constexpr size_t kMostSerial = 35;
constexpr size_t kMostField = 4095;

// What stands before the sender, whose serial number always comes last.
struct Path {
  const char* name;
  DeviceRequest::Kind kind;
  size_t numbers;
  size_t fields;
};
constexpr Path kPaths[] = {
    {"heartbeat", DeviceRequest::Kind::kHeartbeat, 0, 0},
    {"action_progress", DeviceRequest::Kind::kProgress, 2, 2},
    {"action", DeviceRequest::Kind::kEvent, 0, 2},
    {"collect", DeviceRequest::Kind::kCollection, 0, 2},
    {"upload_file", DeviceRequest::Kind::kUpload, 1, 2},
};

std::vector<std::string> Pieces(const std::string& target) {
  std::vector<std::string> pieces;
  size_t begin = 1;
  for (size_t end = 0; end != target.npos; begin = end + 1) {
    end = target.find('/', begin);
    pieces.push_back(target.substr(begin, end - begin));
  }
  return pieces;
}

bool IsText(const std::string& piece, size_t most) {
  const auto unprintable = [](char c) { return (c >= '\0' && c < ' ') || c == '\x7f'; };
  return piece.size() <= most && IsUtf8(piece) &&
         std::none_of(piece.begin(), piece.end(), unprintable);
}

bool ReadNumber(const std::string& piece, long long& number) {
  constexpr size_t kMostDigits = 10;
  const size_t first = !piece.empty() && piece[0] == '-' ? 1 : 0;
  const std::string digits = piece.substr(first);
  if (digits.empty() || digits.size() > kMostDigits ||
      digits.find_first_not_of("0123456789") != digits.npos) {
    return false;
  }
  number = std::stoll(piece);
  return true;
}

}  // namespace

std::optional<DeviceRequest> DeviceRequestFrom(const std::string& target) {
  if (target.empty() || target[0] != '/') {
    return std::nullopt;
  }
  const std::vector<std::string> pieces = Pieces(target);
  const auto* path = std::find_if(std::begin(kPaths), std::end(kPaths),
                                  [&](const Path& known) { return pieces[0] == known.name; });
  if (path == std::end(kPaths) || pieces.size() != path->numbers + path->fields + 2) {
    return std::nullopt;
  }
  DeviceRequest request;
  request.kind = path->kind;
  request.sender.serial = pieces.back();
  if (path->fields > 0) {
    request.sender.field_a = pieces[1 + path->numbers];
    request.sender.field_b = pieces[2 + path->numbers];
  }
  const bool numbers = (path->numbers < 1 || ReadNumber(pieces[1], request.request_id)) &&
                       (path->numbers < 2 || ReadNumber(pieces[2], request.progress));
  const bool texts = IsText(request.sender.serial, kMostSerial) &&
                     IsText(request.sender.field_a, kMostField) &&
                     IsText(request.sender.field_b, kMostField);
  return numbers && texts ? std::optional<DeviceRequest>(request) : std::nullopt;
}

}  // namespace quendeldesk
