// The collection run: what is new on the device is gathered, packed into one archive, delivered,
// and only then counted as collected. And the channel between the processes that drive one.
#ifndef QUENDEL_COLLECT_H_
#define QUENDEL_COLLECT_H_

#include <json/value.h>

#include <cstddef>

#include "quendel/export.h"

// Runs one complete collection.
//
// A fresh run directory, QUENDELGetDstDir() of now, receives "log" with the new log lines, "udc"
// with the results of the user-defined collectors, and "perf" with the files that
// QUENDELParsePerfJson() makes of `perfSeries`. Logs and collectors are worked on by two child
// processes while the series is written; both must end within QUENDELGetWaitPIDTimeout() seconds.
// The run directory is then packed into an archive beside it, of the same name and ".tar.xz".
//
// When `sendToServer` is not 0 the server must be reachable before anything is gathered, the device
// must have a serial number and a signed-in account, and the archive is posted to the server. When
// it is 0 the server is not contacted.
//
// The collectors' settings files change only after the archive was made and, when asked, accepted
// by the server. A run that ends earlier leaves them as they were, and the next run gathers the
// same again. Neither a log or a collector that could not be read or run nor a performance file
// that could not be written fails the run.
//
// "/tmp/quendel" and the run directory must be no links and belong to the effective user; a
// directory of his that others may write to gets mode 0700. The children end with the process that
// started them, however that ends, and stage nothing for another run.
//
// When `removeAfter` is not 0 the run directory and the archive are gone when the function returns,
// whatever it returns. When it is 0 both stay, and are the caller's to remove.
//
// Call this in a worker process that does nothing else and leads a session of its own, one at a
// time on a device: a run reaps any child of the process, and one that fails early can send SIGTERM
// to the whole process group of its caller. "Running a collection" in docs/integration.md says how
// to make the worker, and what it must not have.
//
// Returns 0 when the archive was made and, if asked, accepted, and both kinds of collectors'
// settings were brought up to date; else -1.
QUENDEL_EXPORT int QUENDELStartCollect(int removeAfter, int sendToServer,
                                       const Json::Value& perfSeries);

// How long a collection run waits for its children, in seconds: key "quendel_wait_collect_timeout"
// of "/etc.defaults/arvoinfo.conf", of which the first seven characters count, read as a decimal
// number. 600 when the key is missing or the number is less than 1.
//
// The file is read at the first call only. What that read gave stays for the life of the process.
//
// Returns the limit, at least 1; never fails.
QUENDEL_EXPORT int QUENDELGetWaitPIDTimeout();

// Asks the device's local performance service for its current figures.
//
// `reply` receives the service's whole answer, also one that reports a failure; when the service
// cannot be asked it is as the service's client left it. A series for QUENDELParsePerfJson() holds
// such answers, each as {"success": true, "perf_data": reply}.
//
// Returns 0 when the answer has "success" true and a member "data", else -1.
QUENDEL_EXPORT int QUENDELCollectPerf(Json::Value& reply);

// Writes a series of performance samples as one file per category into `dir`, which must exist:
// "quendel.perf.iSCSI", "quendel.perf.System", "quendel.perf.DiskIO", "quendel.perf.SpaceIO",
// "quendel.perf.Network" and "quendel.perf.Memory". A file of that name is replaced.
//
// `series` is an object with the samples "perf_0", "perf_1" and so on, without a gap: what follows
// one is ignored. A sample counts when its "success" is true, and holds its time under "perf_data",
// "data", "time" and each category's figures beside that, under the category's name; any kind of
// JSON value will do. A file holds a JSON array of {"time", "data"} in the order of the samples, or
// null when no sample has figures for its category. A sample without a time is left out of every
// file, a sample without figures for a category out of that file; both are logged and are no
// failure.
//
// Returns 0 when all six files were written, else -1; one that fails does not stop the others.
QUENDEL_EXPORT int QUENDELParsePerfJson(const char* dir, const Json::Value& series);

// Packs a directory into `archive`, a tar file compressed with xz, as one top-level entry: the last
// component of `dir`, which ends without a "/". Only its owner, the effective user, may read the
// archive. One that exists is replaced when it is a regular file of his with no other name; a link,
// or anything else in its place, is a failure and stays as it is.
//
// Needs the system's "/bin/tar" and xz.
//
// Returns 0, or -1 when tar could not be run or failed; the archive may then be there, incomplete,
// but not empty.
QUENDEL_EXPORT int QUENDELTarCollectData(const char* dir, const char* archive);

// Posts an archive to the server, with its description: file name, device time zone, operating
// system version, and `timestamp`, the start of the run in seconds since the epoch, as a text of
// decimal digits and as local time.
//
// Needs a signed-in cloud account and a serial number. When the time zone or the version cannot be
// read, the archive is posted without a description.
//
// Returns 0 when the server accepted the archive, else -1.
QUENDEL_EXPORT int QUENDELSendCollectData(const char* archive, long timestamp);

// The shared-memory channel hands one block of bytes from one process to another, through a System
// V segment whose key and size in bytes both sides agree on. One process creates the segment; then,
// in either order, one sends and the other receives. Each waits 20 seconds for the other.
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

// Writes `size` bytes of data into the segment and waits for the receiver. The segment is not
// removed.
//
// Returns 0 when the block was received, -2 at once when there is no such segment, and -1 when it
// could not be attached or nobody received the block in time.
QUENDEL_EXPORT int QUENDELShmSend(char* data, size_t size, int key);

// Waits for a block and copies `size` bytes of it into buf, which has room for them. The segment is
// removed in every case: it goes when its creator and the sender have let go of it. While the
// system refuses that, the call does not come back.
//
// Returns 0 when a block was received, -2 at once when there is no such segment, and -1, with buf
// untouched, when it could not be attached or nobody sent a block in time.
QUENDEL_EXPORT int QUENDELShmReceive(char* buf, size_t size, int key);

#endif  // QUENDEL_COLLECT_H_
