// Marks what libquendel shows to the programs that load it; everything else stays hidden.
#ifndef QUENDEL_EXPORT_H_
#define QUENDEL_EXPORT_H_

#define QUENDEL_EXPORT __attribute__((visibility("default")))

#endif  // QUENDEL_EXPORT_H_
