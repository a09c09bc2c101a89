// The appliance's own operations, which a test can make fail.
#include "platform/account.h"
#include "platform/device.h"
#include "platform/error.h"
#include "platform/file.h"
#include "platform/hash.h"
#include "platform/key_value.h"
#include "platform/list.h"
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
