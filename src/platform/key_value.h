// The platform's key-value files: the appliance's settings.
//
// Reading never sees half of a change: it gets the file as it was before or after one. `flags` is
// always 0.
//
// A flat file holds `key=value` lines. A sectioned one holds groups of them, each below a `[name]`
// line; the flat operations pass over those lines.
#ifndef PLATFORM_KEY_VALUE_H_
#define PLATFORM_KEY_VALUE_H_

struct ALIBSZHASH;
struct ALIBSZLIST;

extern "C" {

// Copies the value of one key into buf, cut to size - 1 bytes and NUL-terminated.
// Returns the length of the whole value when the key was found; 0 when the key is missing or its
// value is empty; negative when the file cannot be read. buf is untouched unless the key was found.
int ALIBCFileGetKeyValue(const char* path, const char* key, char* buf, int size, int flags);

// Sets the value of one key, adding the key when the file lacks it and keeping everything else in
// the file. The file must exist. Another writer is waited for, 10 s at most. The change is on the
// disk, whole or not at all, when this returns. Returns positive on success, negative on failure.
int ALIBCFileSetKeyValue(const char* path, const char* key, const char* value, int flags);

// Reads every pair of the file into a hash, over what the hash already holds.
// Returns the number of pairs read, negative when the file cannot be read.
int ALIBCFileGetPair(const char* path, ALIBSZHASH** hash);

// Appends a section with every pair of the hash, in the order of ALIBCSzHashEnumKey(), by one
// write; creates the file when it is missing. A section that was cut short, by a crash or a full
// disk, is no section to the two operations below. What is appended is not synchronised: it is
// meant for a run that starts afresh after a power failure. Returns positive on success, negative
// on failure with the file as it was.
int ALIBCFileAddSection(const char* path, const char* section, ALIBSZHASH* hash, int flags);

// Appends the names of the file's sections to a list, in file order; a name that several sections
// bear comes once. Returns the number of names, negative when the file cannot be read.
int ALIBCFileEnumSection(const char* path, ALIBSZLIST** sections);

// Reads the pairs of one section into a hash, over what the hash already holds. Where several
// sections bear the name, a later one goes over an earlier one. Walking through a file's sections
// in turn costs no more than reading the file once, when it has not changed for a tenth of a
// second. Returns positive
// on success; negative when there is no such section or the file cannot be read.
int ALIBCFileGetSection(const char* path, const char* section, ALIBSZHASH** hash);
}

#endif  // PLATFORM_KEY_VALUE_H_
