// The platform's key-value files: the appliance's settings.
//
// Reading never sees half of a change: it gets the file as it was before or after one. `flags` is
// always 0.
#ifndef PLATFORM_KEY_VALUE_H_
#define PLATFORM_KEY_VALUE_H_

struct ALIBSZHASH;

extern "C" {

// Copies the value of one key into buf, cut to size - 1 bytes and NUL-terminated.
// Returns the length of the whole value when the key was found; 0 when the key is missing or its
// value is empty; negative when the file cannot be read. buf is untouched unless the key was found.
int ALIBCFileGetKeyValue(const char* path, const char* key, char* buf, int size, int flags);

// Sets the value of one key, adding the key when the file lacks it and keeping everything else in
// the file. The file must exist. The change is on the disk, whole or not at all, when this returns.
// Returns positive on success, negative on failure.
int ALIBCFileSetKeyValue(const char* path, const char* key, const char* value, int flags);

// Reads every pair of the file into a hash, over what the hash already holds.
// Returns the number of pairs read, negative when the file cannot be read.
int ALIBCFileGetPair(const char* path, ALIBSZHASH** hash);
}

#endif  // PLATFORM_KEY_VALUE_H_
