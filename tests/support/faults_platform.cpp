// The appliance's own operations, which a test can make fail.
#include <array>
#include <cstdarg>
#include <string>

#include "base/json_text.h"
#include "platform/account.h"
#include "platform/api_runner.h"
#include "platform/device.h"
#include "platform/error.h"
#include "platform/file.h"
#include "platform/hash.h"
#include "platform/key_value.h"
#include "platform/list.h"
#include "platform/local_account.h"
#include "platform/process.h"
#include "platform/zone.h"
#include "support/own_work.h"
#include "support/require.h"
#include "support/wrap.h"

QUENDEL_WRAP(int, ARVOMYHUBAccountGet, (void* record), record);
QUENDEL_WRAP(int, ALIBGetSerialNumber, (char* buf, int size), buf, size);
QUENDEL_WRAP(int, ALIBServiceIsEnabled, (const char* name), name);
QUENDEL_WRAP(int, ALIBCErrGet, ());

QUENDEL_WRAP(int, ALIBCFileExist, (const char* path), path);
QUENDEL_WRAP(int, ALIBCFileCheckDir, (const char* path), path);
QUENDEL_WRAP(int, ALIBCFileUnlock, (int lockId), lockId);

QUENDEL_WRAP(ALIBSZHASH*, ALIBCSzHashAlloc, (int size), size);
QUENDEL_WRAP(void, ALIBCSzHashFree, (ALIBSZHASH * hash), hash);
QUENDEL_WRAP(const char*, ALIBCSzHashGetValue, (ALIBSZHASH * hash, const char* key), hash, key);
QUENDEL_WRAP(int, ALIBCSzHashSetValue, (ALIBSZHASH * *hash, const char* key, const char* value),
             hash, key, value);
QUENDEL_WRAP(void, ALIBCHashRemoveAll, (ALIBSZHASH * hash), hash);
QUENDEL_WRAP(int, ALIBCSzHashEnumKey, (ALIBSZHASH * hash, ALIBSZLIST** keys), hash, keys);

QUENDEL_WRAP(int, ALIBCFileGetKeyValue,
             (const char* path, const char* key, char* buf, int size, int flags), path, key, buf,
             size, flags);
QUENDEL_WRAP(int, ALIBCFileSetKeyValue,
             (const char* path, const char* key, const char* value, int flags), path, key, value,
             flags);
QUENDEL_WRAP(int, ALIBCFileGetPair, (const char* path, ALIBSZHASH** hash), path, hash);

QUENDEL_WRAP(ALIBSZLIST*, ALIBCSzListAlloc, (int size), size);
QUENDEL_WRAP(void, ALIBCSzListFree, (ALIBSZLIST * list), list);
QUENDEL_WRAP(void, ALIBCSzListRemoveAll, (ALIBSZLIST * list), list);
QUENDEL_WRAP(int, ALIBCSzListPush, (ALIBSZLIST * *list, const char* text), list, text);
QUENDEL_WRAP(int, ALIBCSzListFind, (const ALIBSZLIST* list, const char* text), list, text);
QUENDEL_WRAP(int, ALIBCSzListSize, (const ALIBSZLIST* list), list);
QUENDEL_WRAP(const char*, ALIBCSzListGet, (const ALIBSZLIST* list, int index), list, index);

QUENDEL_WRAP(int, ALIBCStrTok, (const char* text, const char* separators, ALIBSZLIST** list), text,
             separators, list);

QUENDEL_WRAP(int, ALIBCFileAddSection,
             (const char* path, const char* section, ALIBSZHASH* hash, int flags), path, section,
             hash, flags);
QUENDEL_WRAP(int, ALIBCFileEnumSection, (const char* path, ALIBSZLIST** sections), path, sections);
QUENDEL_WRAP(int, ALIBCFileGetSection, (const char* path, const char* section, ALIBSZHASH** hash),
             path, section, hash);

QUENDEL_WRAP(int, ALIBCFileEnumDir,
             (const char* dir, const char* prefix, ALIBSZLIST** names, int flags), dir, prefix,
             names, flags);
QUENDEL_WRAP(int, ALIBCFileStat, (const char* path, int flags, struct stat* status), path, flags,
             status);
QUENDEL_WRAP(int, ALIBCFileTouch, (const char* path), path);
QUENDEL_WRAP(int, ALIBCopyRemoveDir, (const char* path), path);

QUENDEL_WRAP(int, ARVOFSMkdirP,
             (const char* path, int flag, int parents, int uid, int gid, unsigned int mode), path,
             flag, parents, uid, gid, mode);

QUENDEL_WRAP(int, ARVOZoneGet, (char* zone, int size, int* index), zone, size, index);
QUENDEL_WRAP(int, ARVOZoneDesc, (const char* zone, char* desc, int size), zone, desc, size);

QUENDEL_WRAP(ALIBCMRESULT*, ALIBCMResultAlloc, ());
QUENDEL_WRAP(void, ALIBCMResultFree, (ALIBCMRESULT * result), result);
QUENDEL_WRAP(const int*, ALIBCMResultCoreErrorsGet, (ALIBCMRESULT * result), result);
QUENDEL_WRAP(int, ARVOLocalAccountUserPrepareForQuendel, (const char* user, int kind), user, kind);

QUENDEL_WRAP(int, ALIBCProcForkEx, (int flags), flags);
QUENDEL_WRAP(int, ALIBCPclose, (FILE * stream), stream);

namespace {

constexpr size_t kMostArguments = 8;

// A program and its arguments, up to the null one that ends them; recorded like a list of texts.
using CommandLine = std::array<const char*, kMostArguments + 2>;

// Takes the texts that follow the program. The rest stays null.
CommandLine TakeCommandLine(const char* program, va_list arguments) {
  const quendel::test::OwnWork ownWork;
  CommandLine line = {program};
  size_t count = 1;
  while (const char* argument = va_arg(arguments, const char*)) {
    quendel::test::Require(count <= kMostArguments, "a program with more arguments than expected");
    line[count++] = argument;
  }
  return line;
}

// The 80 bytes of a copy's options, as 32-bit numbers.
std::string DescribeCopyOptions(const void* options) {
  const quendel::test::OwnWork ownWork;
  std::string text;
  const auto* words = static_cast<const unsigned*>(options);
  for (int i = 0; options != nullptr && i < 20; ++i) {
    text += (i == 0 ? "" : ",") + std::to_string(words[i]);
  }
  return text;
}

}  // namespace

extern "C" {

// No null pointer ends the names, so only the first is recorded.
QUENDEL_WRAP_BY_HAND(ARVOLocalAccountUserDelete);
int __real_ARVOLocalAccountUserDelete(const char* const* names, int count, ALIBCMRESULT* result);
int __wrap_ARVOLocalAccountUserDelete(const char* const* names, int count, ALIBCMRESULT* result) {
  const quendel::test::WrappedCall call("ARVOLocalAccountUserDelete",
                                        names == nullptr ? nullptr : names[0], count);
  return call.fails() ? call.result<int>()
                      : __real_ARVOLocalAccountUserDelete(names, count, result);
}

QUENDEL_WRAP_BY_HAND(ARVOFileCopy);
int __real_ARVOFileCopy(const char* src, const char* dst, const void* options);
int __wrap_ARVOFileCopy(const char* src, const char* dst, const void* options) {
  const std::string words = DescribeCopyOptions(options);
  const quendel::test::WrappedCall call("ARVOFileCopy", src, dst, words.c_str());
  return call.fails() ? call.result<int>() : __real_ARVOFileCopy(src, dst, options);
}

QUENDEL_WRAP_BY_HAND(ALIBCExec);
int __real_ALIBCExec(const char* program, const char* a1, const char* a2, const char* a3,
                     const char* a4);
int __wrap_ALIBCExec(const char* program, const char* a1, const char* a2, const char* a3,
                     const char* a4) {
  const CommandLine line = {program, a1, a2, a3, a4};
  const quendel::test::WrappedCall call("ALIBCExec", line.data());
  return call.fails() ? call.result<int>() : __real_ALIBCExec(program, a1, a2, a3, a4);
}

QUENDEL_WRAP_BY_HAND(ALIBCExecl);
int __real_ALIBCExecl(const char* program, int flags, ...);
int __wrap_ALIBCExecl(const char* program, int flags, ...) {
  quendel::test::Require(flags == 0xBB, "ALIBCExecl with other flags than ever");
  va_list arguments;
  va_start(arguments, flags);
  const CommandLine line = TakeCommandLine(program, arguments);
  va_end(arguments);
  const quendel::test::WrappedCall call("ALIBCExecl", line.data());
  return call.fails() ? call.result<int>()
                      : __real_ALIBCExecl(program, flags, line[1], line[2], line[3], line[4],
                                          line[5], line[6], line[7], line[8], line[9]);
}

QUENDEL_WRAP_BY_HAND(ALIBCPopen);
FILE* __real_ALIBCPopen(const char* program, const char* mode, ...);
FILE* __wrap_ALIBCPopen(const char* program, const char* mode, ...) {
  va_list arguments;
  va_start(arguments, mode);
  const CommandLine line = TakeCommandLine(program, arguments);
  va_end(arguments);
  const quendel::test::WrappedCall call("ALIBCPopen", line.data());
  return call.fails() ? call.result<FILE*>()
                      : __real_ALIBCPopen(program, mode, line[1], line[2], line[3], line[4],
                                          line[5], line[6], line[7], line[8], line[9]);
}

// ARVO::APIRunner::Exec, by the name that the linker knows it by. When it fails, nothing is called
// and `out` stays as it is. Weak, so that a test program can answer in its place.
QUENDEL_WRAP_BY_HAND(_ZN4ARVO9APIRunner4ExecERN4Json5ValueEPKciS5_RKS2_S5_);
void __real__ZN4ARVO9APIRunner4ExecERN4Json5ValueEPKciS5_RKS2_S5_(Json::Value& out, const char* api,
                                                                  int version, const char* method,
                                                                  const Json::Value& params,
                                                                  const char* user);
__attribute__((weak)) void __wrap__ZN4ARVO9APIRunner4ExecERN4Json5ValueEPKciS5_RKS2_S5_(
    Json::Value& out, const char* api, int version, const char* method, const Json::Value& params,
    const char* user) {
  const std::string text = quendel::JsonToText(params);
  const quendel::test::WrappedCall call("ARVO::APIRunner::Exec", api, version, method, text.c_str(),
                                        user);
  if (!call.fails()) {
    __real__ZN4ARVO9APIRunner4ExecERN4Json5ValueEPKciS5_RKS2_S5_(out, api, version, method, params,
                                                                 user);
  }
}
[[maybe_unused]] static const bool namesTheApiRunner =
    quendel::test::RegisterWrapped("ARVO::APIRunner::Exec");
}
