// The appliance's own operations, and the collectors that a run's children call.
#include <array>
#include <cstdarg>
#include <string>

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
#include "platform/transmitor.h"
#include "platform/zone.h"
#include "quendel.h"
#include "support/own_work.h"
#include "support/require.h"
#include "support/wrap.h"

using quendel::test::OwnWork;
using quendel::test::PassCall;

namespace {

// No null pointer ends the names, so only the first is shown.
struct Names : quendel::test::Shown {
  explicit Names(const char* const* given) : names(given) {}
  operator const char* const*() const { return names; }
  std::string Text() const { return names == nullptr ? "(null)" : names[0]; }

  const char* const* names;
};

// The 80 bytes of a copy's options, as 32-bit numbers.
struct CopyOptions : quendel::test::Shown {
  explicit CopyOptions(const void* given) : options(given) {}
  operator const void*() const { return options; }
  std::string Text() const {
    std::string text;
    const auto* words = static_cast<const unsigned*>(options);
    for (int i = 0; options != nullptr && i < 20; ++i) {
      text += (i == 0 ? "" : ",") + std::to_string(words[i]);
    }
    return text;
  }

  const void* options;
};

}  // namespace

QUENDEL_WRAP(ARVOMYHUBAccountGet, int, (void* record), record);
QUENDEL_WRAP(ALIBGetSerialNumber, int, (char* buf, int size), buf, size);
QUENDEL_WRAP(ALIBServiceIsEnabled, int, (const char* name), name);
QUENDEL_WRAP(ALIBCErrGet, int, ());

QUENDEL_WRAP(ALIBCFileExist, int, (const char* path), path);
QUENDEL_WRAP(ALIBCFileCheckDir, int, (const char* path), path);
QUENDEL_WRAP(ALIBCFileUnlock, int, (int lockId), lockId);

QUENDEL_WRAP(ARVOFileCopy, int, (const char* src, const char* dst, const void* options), src, dst,
             CopyOptions(options));

QUENDEL_WRAP(ALIBCSzHashAlloc, ALIBSZHASH*, (int size), size);
QUENDEL_WRAP(ALIBCSzHashFree, void, (ALIBSZHASH * hash), hash);
QUENDEL_WRAP(ALIBCSzHashGetValue, const char*, (ALIBSZHASH * hash, const char* key), hash, key);
QUENDEL_WRAP(ALIBCSzHashSetValue, int, (ALIBSZHASH * *hash, const char* key, const char* value),
             hash, key, value);
QUENDEL_WRAP(ALIBCHashRemoveAll, void, (ALIBSZHASH * hash), hash);
QUENDEL_WRAP(ALIBCSzHashEnumKey, int, (ALIBSZHASH * hash, ALIBSZLIST** keys), hash, keys);

QUENDEL_WRAP(ALIBCFileGetKeyValue, int,
             (const char* path, const char* key, char* buf, int size, int flags), path, key, buf,
             size, flags);
QUENDEL_WRAP(ALIBCFileSetKeyValue, int,
             (const char* path, const char* key, const char* value, int flags), path, key, value,
             flags);
QUENDEL_WRAP(ALIBCFileGetPair, int, (const char* path, ALIBSZHASH** hash), path, hash);

QUENDEL_WRAP(ALIBCSzListAlloc, ALIBSZLIST*, (int size), size);
QUENDEL_WRAP(ALIBCSzListFree, void, (ALIBSZLIST * list), list);
QUENDEL_WRAP(ALIBCSzListRemoveAll, void, (ALIBSZLIST * list), list);
QUENDEL_WRAP(ALIBCSzListPush, int, (ALIBSZLIST * *list, const char* text), list, text);
QUENDEL_WRAP(ALIBCSzListFind, int, (const ALIBSZLIST* list, const char* text), list, text);
QUENDEL_WRAP(ALIBCSzListSize, int, (const ALIBSZLIST* list), list);
QUENDEL_WRAP(ALIBCSzListGet, const char*, (const ALIBSZLIST* list, int index), list, index);

QUENDEL_WRAP(ALIBCStrTok, int, (const char* text, const char* separators, ALIBSZLIST** list), text,
             separators, list);

QUENDEL_WRAP(ALIBCFileAddSection, int,
             (const char* path, const char* section, ALIBSZHASH* hash, int flags), path, section,
             hash, flags);
QUENDEL_WRAP(ALIBCFileEnumSection, int, (const char* path, ALIBSZLIST** sections), path, sections);
QUENDEL_WRAP(ALIBCFileGetSection, int, (const char* path, const char* section, ALIBSZHASH** hash),
             path, section, hash);

QUENDEL_WRAP(ALIBCFileEnumDir, int,
             (const char* dir, const char* prefix, ALIBSZLIST** names, int flags), dir, prefix,
             names, flags);
QUENDEL_WRAP(ALIBCFileStat, int, (const char* path, int flags, struct stat* status), path, flags,
             status);
QUENDEL_WRAP(ALIBCFileTouch, int, (const char* path), path);
QUENDEL_WRAP(ALIBCopyRemoveDir, int, (const char* path), path);

QUENDEL_WRAP(ARVOFSMkdirP, int,
             (const char* path, int flag, int parents, int uid, int gid, unsigned int mode), path,
             flag, parents, uid, gid, mode);

QUENDEL_WRAP(ARVOZoneGet, int, (char* zone, int size, int* index), zone, size, index);
QUENDEL_WRAP(ARVOZoneDesc, int, (const char* zone, char* desc, int size), zone, desc, size);

QUENDEL_WRAP(ALIBCMResultAlloc, ALIBCMRESULT*, ());
QUENDEL_WRAP(ALIBCMResultFree, void, (ALIBCMRESULT * result), result);
QUENDEL_WRAP(ALIBCMResultCoreErrorsGet, const int*, (ALIBCMRESULT * result), result);
QUENDEL_WRAP(ARVOLocalAccountUserDelete, int,
             (const char* const* names, int count, ALIBCMRESULT* result), Names(names), count,
             result);
QUENDEL_WRAP(ARVOLocalAccountUserPrepareForQuendel, int, (const char* user, int kind), user, kind);

QUENDEL_WRAP(ALIBCProcForkEx, int, (int flags), flags);
QUENDEL_WRAP(ALIBCPclose, int, (FILE * stream), stream);

// The operations that are no C functions, by the names that the linker knows them by.
QUENDEL_WRAP_CPP(_ZN4ARVO9APIRunner4ExecERN4Json5ValueEPKciS5_RKS2_S5_, "ARVO::APIRunner::Exec",
                 void,
                 (Json::Value & out, const char* api, int version, const char* method,
                  const Json::Value& params, const char* user),
                 out, api, version, method, params, user);
QUENDEL_WRAP_CPP(_ZN10Transmitor8TransmitERKN4Json5ValueE, "Transmitor::Transmit", int,
                 (Transmitor * self, const Json::Value& request), self, request);
QUENDEL_WRAP_CPP(_ZN10Transmitor11GetDataJsonERN4Json5ValueE, "Transmitor::GetDataJson", int,
                 (Transmitor * self, Json::Value& reply), self, reply);

// What a run's children do.
QUENDEL_WRAP_CPP(_Z17QUENDELCollectLogPKc, "QUENDELCollectLog", int, (const char* directory),
                 directory);
QUENDEL_WRAP_CPP(_Z17QUENDELCollectUDCPKc, "QUENDELCollectUDC", int, (const char* directory),
                 directory);

// ---- Programs are started with any number of arguments. To a test they are one list, which a null
// pointer ends: the program and its arguments.
namespace {

constexpr size_t kMostArguments = 8;

using CommandLine = std::array<const char*, kMostArguments + 2>;

// Takes the texts that follow the program. The rest stays null.
CommandLine TakeCommandLine(const char* program, va_list arguments) {
  const OwnWork ownWork;
  CommandLine line = {program};
  size_t count = 1;
  while (const char* argument = va_arg(arguments, const char*)) {
    quendel::test::Require(count <= kMostArguments, "a program with more arguments than expected");
    line[count++] = argument;
  }
  return line;
}

}  // namespace

extern "C" {

QUENDEL_WRAP_BY_HAND(ALIBCExec, "ALIBCExec");
int __real_ALIBCExec(const char* program, const char* a1, const char* a2, const char* a3,
                     const char* a4);
int __wrap_ALIBCExec(const char* program, const char* a1, const char* a2, const char* a3,
                     const char* a4) {
  const CommandLine line = {program, a1, a2, a3, a4};
  return PassCall<int(const char* const*)>(
      wrapped_ALIBCExec,
      [](const char* const* l) { return __real_ALIBCExec(l[0], l[1], l[2], l[3], l[4]); },
      line.data());
}

QUENDEL_WRAP_BY_HAND(ALIBCExecl, "ALIBCExecl");
int __real_ALIBCExecl(const char* program, int flags, ...);
int __wrap_ALIBCExecl(const char* program, int flags, ...) {
  quendel::test::Require(flags == 0xBB, "ALIBCExecl with other flags than ever");
  va_list arguments;
  va_start(arguments, flags);
  const CommandLine line = TakeCommandLine(program, arguments);
  va_end(arguments);
  return PassCall<int(const char* const*)>(
      wrapped_ALIBCExecl,
      [flags](const char* const* l) {
        return __real_ALIBCExecl(l[0], flags, l[1], l[2], l[3], l[4], l[5], l[6], l[7], l[8], l[9]);
      },
      line.data());
}

QUENDEL_WRAP_BY_HAND(ALIBCPopen, "ALIBCPopen");
FILE* __real_ALIBCPopen(const char* program, const char* mode, ...);
FILE* __wrap_ALIBCPopen(const char* program, const char* mode, ...) {
  va_list arguments;
  va_start(arguments, mode);
  const CommandLine line = TakeCommandLine(program, arguments);
  va_end(arguments);
  return PassCall<FILE*(const char* const*)>(
      wrapped_ALIBCPopen,
      [mode](const char* const* l) {
        return __real_ALIBCPopen(l[0], mode, l[1], l[2], l[3], l[4], l[5], l[6], l[7], l[8], l[9]);
      },
      line.data());
}
}
