// The device's figures as they stand now.
#ifndef PLATFORM_STANDALONE_PERFORMANCE_FIGURES_H_
#define PLATFORM_STANDALONE_PERFORMANCE_FIGURES_H_

#include <json/value.h>

namespace platform {

// Returns an object with "time" and the six categories, as docs/performance-figures.md describes
// them. A figure whose source cannot be read is left out.
Json::Value CurrentFigures();

}  // namespace platform

#endif  // PLATFORM_STANDALONE_PERFORMANCE_FIGURES_H_
