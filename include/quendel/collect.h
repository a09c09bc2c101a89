// A collection run, and the channel between the processes that drive one.
#ifndef QUENDEL_COLLECT_H_
#define QUENDEL_COLLECT_H_

#include <cstddef>

#include "quendel/export.h"

// The shared-memory channel hands one block of bytes from one process to another, through a System
// V segment whose key and size in bytes both sides agree on. One process creates the segment; then,
// in either order and each within the other's 20 seconds, one sends and the other receives.
//
// The segment's first byte tells how the exchange stands: 0 is "nothing sent yet" and '*' is
// "received". So a block must not begin with a zero byte, which the receiver would wait for in
// vain, nor with '*', which counts as received at once. Anybody on the device may read and write
// the segment. Nothing guards the copy itself: blocks are small, and the sender writes them in one
// go.

// Creates the segment, or finds the one that has this key already, and stays attached to it until
// the calling process ends.
//
// Returns 0, or -1 when the segment could not be made or attached.
QUENDEL_EXPORT int QUENDELShmAlloc(size_t size, int key);

// Writes `size` bytes of data into the segment and waits up to 20 seconds for the receiver. The
// segment is not removed.
//
// Returns 0 when the block was received, -2 at once when there is no such segment, and -1 when it
// could not be attached or nobody received the block in time.
QUENDEL_EXPORT int QUENDELShmSend(char* data, size_t size, int key);

// Waits up to 20 seconds for a block and copies `size` bytes of it into buf, which has room for
// them. The segment is removed in every case: it goes when its creator and the sender have let go
// of it. While the system refuses that, the call does not come back.
//
// Returns 0 when a block was received, -2 at once when there is no such segment, and -1, with buf
// untouched, when it could not be attached or nobody sent a block in time.
QUENDEL_EXPORT int QUENDELShmReceive(char* buf, size_t size, int key);

#endif  // QUENDEL_COLLECT_H_
