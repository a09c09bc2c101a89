// The two files in which the collectors stage their new state until the run commits it.
//
// They lie below "/tmp". What is in them counts only as long as nobody else can have put it there,
// and as long as it was staged for the run that commits it.
#ifndef COLLECTORS_STAGED_STATE_H_
#define COLLECTORS_STAGED_STATE_H_

#include <sys/types.h>

struct ALIBSZHASH;

namespace quendel {

// From now on this process stages for the run of its parent, which is this process, and for no
// other: once its parent is gone it stages nothing more. Without a run a process stages for itself.
void StageForRunOf(pid_t parent);

// Removes one of the two files, which exists. Returns false, with errno set, when it stays.
bool RemoveStagedState(const char* file);

// Appends the section of one collector to one of the two files. Returns false on failure.
bool AppendStagedState(const char* file, const char* conf, ALIBSZHASH* state);

// Tells whether a file may be committed. Only of the two files more is asked than that it can be
// read.
bool MayBeCommitted(const char* file);

}  // namespace quendel

#endif  // COLLECTORS_STAGED_STATE_H_
