// The device's own accounts, and the record in which operations on several things report each of
// them.
#ifndef PLATFORM_LOCAL_ACCOUNT_H_
#define PLATFORM_LOCAL_ACCOUNT_H_

struct ALIBCMRESULT;

extern "C" {

// Makes an empty result record. Returns null when memory ran out. ALIBCMResultFree() takes it back.
ALIBCMRESULT* ALIBCMResultAlloc();

// Frees a result record; null is allowed.
void ALIBCMResultFree(ALIBCMRESULT* result);

// Returns the first of the record's core error codes, which the record keeps, or null when it holds
// none.
const int* ALIBCMResultCoreErrorsGet(ALIBCMRESULT* result);

// Makes the support account of this name, or what is there of that account, ready for a log-in:
// user ID 50001, group ID 100, home "/run/quendelhome", a shell that lets it in, no password. The
// home itself is the caller's. `kind` is always 5. Returns 0, or negative for a name that is none
// of an account, one that belongs to another account, and when the account could not be made.
int ARVOLocalAccountUserPrepareForQuendel(const char* user, int kind);

// Deletes accounts by their names; their homes stay. Every name is tried. On failure the record
// holds one core error code for each name that failed: 7424 (0x1D00) for an account that does not
// exist. Returns 0 when all of them are gone, negative on failure.
int ARVOLocalAccountUserDelete(const char* const* names, int count, ALIBCMRESULT* result);
}

#endif  // PLATFORM_LOCAL_ACCOUNT_H_
