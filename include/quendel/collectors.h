// The collectors: what the service gathers, and what it remembers of what it has sent.
//
// Every log and every user-defined collector (an executable whose output is collected) has a
// configuration file of its own in "/usr/arvo/etc/quendel", named "quendel.log.*" or
// "quendel.udc.*". The file is installed with the collector; it names the collector and holds its
// state.
//
// The state changes in two phases. QUENDELCollectLog() and QUENDELCollectUDC() leave these files
// alone and stage the new values in "/tmp/quendel/quendel.log.update.conf" and
// "/tmp/quendel/quendel.udc.update.conf". QUENDELUpdateCollectConf() commits them, once the
// collected data has arrived. Data of a run that is given up in between is collected again by the
// next one. The two files must be regular files of the effective user, in a directory that is his
// alone and no link: nothing is staged in anything else, nor committed from it.
//
// In a message, "ret = %d" is the platform's last error.
#ifndef QUENDEL_COLLECTORS_H_
#define QUENDEL_COLLECTORS_H_

#include <cstdint>

#include "quendel/export.h"

// The configuration and state of one log. Texts are NUL-terminated and cut to their field; each
// field comes from the key of its name. Numbers are decimal in the file; what does not begin with a
// digit reads as 0.
struct QUENDELLogConf_t {
  uint32_t inode;      // of the live log when it was last collected from its start, low 32 bits
  int64_t last_byte;   // length of the last line collected, without its line end
  int64_t total_byte;  // offset in the live log just past that line, its line end included
  char last_hash[64];  // MD5 of that line, 32 lowercase hexadecimal digits
  char name[64];       // file name of the collected copy
  char path[256];      // of the live log, absolute
  char tar_log_inode[256];  // inodes of the archives collected, "," between them, archive 1 first
};

// The configuration and state of one user-defined collector.
struct QUENDELUDCConf_t {
  char last_hash[64];  // MD5 of its last output that was delivered, 32 lowercase hexadecimal digits
  char name[64];       // key of its result
  char path[256];      // of the executable, absolute
};

// Reads a log's configuration file into the caller's record. All seven keys must be there and not
// empty, in the order name, path, last_hash, tar_log_inode, last_byte, total_byte, inode.
//
// Returns 0, or -1 for a null record and at the first key that is missing; the fields read before
// it are filled then, the others as they were.
QUENDEL_EXPORT int QUENDELGetLogConf(const char* path, QUENDELLogConf_t* conf);

// Reads a user-defined collector's configuration file into the caller's record. All three keys must
// be there and not empty, in the order name, path, last_hash.
//
// Returns 0, or -1 for a null record and at the first key that is missing; the fields read before
// it are filled then, the others as they were.
QUENDEL_EXPORT int QUENDELGetUDCConf(const char* path, QUENDELUDCConf_t* conf);

// Forgets what was sent of a log, so that the next collection sends the live log and every archive
// from the start: each of last_hash, tar_log_inode, last_byte, total_byte and inode becomes a text
// of two double quotes, which no line, archive or file matches. A collection that is under way may
// still commit its own state over this.
//
// Returns 0, also when the file does not exist, or -1 at the first key that could not be written;
// the keys before it stay reset.
QUENDEL_EXPORT int QUENDELResetLogConf(const char* path);

// Forgets what a user-defined collector printed last, so that the next collection sends its output
// in full: last_hash becomes a text of two double quotes.
//
// Returns 0, also when the file does not exist, or -1 when the key could not be written.
QUENDEL_EXPORT int QUENDELResetUDCConf(const char* path);

// Commits the state that a collection staged in the file at `path`: writes every pair of each of
// its sections into the configuration file that the section is named by. The staged file stays.
//
// A section that cannot be read or written is logged and left; its collector sends again what it
// sent already. However early a commit ends, no line is passed over because of it.
//
// Returns 0 when every section was tried or the file does not exist, or -1 when memory ran out or
// the file could not be read.
QUENDEL_EXPORT int QUENDELUpdateCollectConf(const char* path);

// Copies into the existing directory `dstDir` what every configured log has gained since the
// collection that was last committed, and stages the new state of each.
//
// New lines, or the whole live log when it was replaced or rewritten, go to the file named by the
// log's "name". Archives are the log's path and ".1.xz", ".2.xz" and so on without a gap. The
// oldest new one gives that file its new lines, before those of the log, when the last line
// collected is found in it. Otherwise it goes beside that file whole, with the same ending, as
// every other new archive does. Memory use does not depend on the size of a log or of a line.
//
// A log that cannot be collected is logged, keeps its state and does not keep the others from
// theirs. Not for several threads or processes at once: the staged state has one fixed place.
//
// Returns 0 whatever happened to single logs, or -1 when the configuration directory cannot be
// listed or memory ran out.
QUENDEL_EXPORT int QUENDELCollectLog(const char* dstDir);

// Runs every user-defined collector, one after the other and without a time limit, and writes what
// they printed into "udc.result" in the existing directory `dstDir`: a JSON object with a member
// for each collector's "name", or a JSON null when there is none. The member is the collector's
// output when that is JSON and has changed, "Same" when it has not changed, or "Error" when it
// could not be run. Other output is left out. The new state of each that changed is staged.
//
// Standard output is all that counts: the exit status is not looked at. The output is held in
// memory whole. Not for several threads or processes at once: the staged state has one fixed place.
//
// Returns 0 when the result file was written, whatever happened to single collectors, else -1;
// nothing of this run is staged then, but what an older one staged may still be.
QUENDEL_EXPORT int QUENDELCollectUDC(const char* dstDir);

#endif  // QUENDEL_COLLECTORS_H_
