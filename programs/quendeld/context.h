// What every part of the daemon stands on.
#ifndef QUENDELD_CONTEXT_H_
#define QUENDELD_CONTEXT_H_

#include "journal.h"
#include "loop.h"
#include "settings.h"
#include "worker_pool.h"

namespace quendeld {

struct Context {
  Loop& loop;
  Settings& settings;
  Journal& journal;
  WorkerPool& workers;
};

}  // namespace quendeld

#endif  // QUENDELD_CONTEXT_H_
