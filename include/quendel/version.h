// The version of these headers; the build, the packages and the tools take theirs from here.
#ifndef QUENDEL_VERSION_H_
#define QUENDEL_VERSION_H_

#define QUENDEL_VERSION "1.0.0"

#endif  // QUENDEL_VERSION_H_
