// The platform's list of strings. Strings are NUL-terminated and are copied in.
#ifndef PLATFORM_LIST_H_
#define PLATFORM_LIST_H_

struct ALIBSZLIST;

extern "C" {

// Makes an empty list with room for `size` strings; it grows when that is not enough.
// Returns null when memory ran out or the size is negative. ALIBCSzListFree() takes it back.
ALIBSZLIST* ALIBCSzListAlloc(int size);

// Frees a list and everything in it; null is allowed.
void ALIBCSzListFree(ALIBSZLIST* list);

// Takes every string out and leaves the list usable.
void ALIBCSzListRemoveAll(ALIBSZLIST* list);

// Appends a string. Growing may move the list, hence the pointer's address.
// Returns the new number of strings, negative on failure.
int ALIBCSzListPush(ALIBSZLIST** list, const char* text);

// Returns the index of the first string equal to `text`, or a negative value when there is none.
int ALIBCSzListFind(const ALIBSZLIST* list, const char* text);

// Returns the number of strings.
int ALIBCSzListSize(const ALIBSZLIST* list);

// Returns the string at an index, which the list keeps, or null when the index is out of range.
const char* ALIBCSzListGet(const ALIBSZLIST* list, int index);

// Splits a text at every byte that is one of `separators` and appends the pieces to a list. Empty
// pieces are dropped, so a text of nothing but separators gives none.
// Returns the number of pieces, negative on failure.
int ALIBCStrTok(const char* text, const char* separators, ALIBSZLIST** list);
}

#endif  // PLATFORM_LIST_H_
