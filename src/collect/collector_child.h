// The two child processes of a collection run.
#ifndef COLLECT_COLLECTOR_CHILD_H_
#define COLLECT_COLLECTOR_CHILD_H_

namespace quendel {

// One child process: what it is to gather and, once started, its process id and marker file.
struct CollectorChild {
  const char* kind;         // "udc" or "log"
  char directory[64] = {};  // where it puts what it gathers
  char marker[64] = {};     // an empty file that exists while it is at work
  int id = 0;
  bool finished = false;
};

// Forks the child, which gathers into its directory and exits with status 0 whatever came of it.
// Returns 0, or -1 with the child as it was.
int StartCollectorChild(CollectorChild& child);

}  // namespace quendel

#endif  // COLLECT_COLLECTOR_CHILD_H_
