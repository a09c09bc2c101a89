// The platform's string-to-string hash. Keys and values are NUL-terminated and are copied in.
//
// Operations that can replace the hash take the address of the caller's pointer, because growing
// may move it.
#ifndef PLATFORM_HASH_H_
#define PLATFORM_HASH_H_

struct ALIBSZHASH;
struct ALIBSZLIST;

extern "C" {

// Makes an empty hash with room for `size` pairs; it grows when that is not enough.
// Returns null when memory ran out or the size is negative. ALIBCSzHashFree() takes it back.
ALIBSZHASH* ALIBCSzHashAlloc(int size);

// Frees a hash and everything in it; null is allowed.
void ALIBCSzHashFree(ALIBSZHASH* hash);

// Looks a key up. Returns the value, which the hash keeps, or null when the key is absent.
const char* ALIBCSzHashGetValue(ALIBSZHASH* hash, const char* key);

// Stores a value under a key, replacing what was there; the value may be one that the hash keeps.
// Returns 0, or negative on failure.
int ALIBCSzHashSetValue(ALIBSZHASH** hash, const char* key, const char* value);

// Takes every pair out and leaves the hash usable.
void ALIBCHashRemoveAll(ALIBSZHASH* hash);

// Appends every key to a list. A commit writes the keys in this order, so it is part of the
// contract: descending by byte value, which puts "total_byte", "tar_log_inode" and "last_hash"
// before "last_byte" and "inode". A commit that is cut short after any of them makes the next
// collection repeat lines and never lose any. Returns the number of keys, negative on failure.
int ALIBCSzHashEnumKey(ALIBSZHASH* hash, ALIBSZLIST** keys);
}

#endif  // PLATFORM_HASH_H_
