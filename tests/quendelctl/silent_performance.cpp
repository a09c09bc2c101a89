// Preloaded into quendelctl: a device whose performance figures are not to be had.
#include "quendel/collect.h"

int QUENDELCollectPerf(Json::Value& /*reply*/) {
  return -1;
}
