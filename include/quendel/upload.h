// What the server may fetch from the device, and the vendor's support staff on it.
#ifndef QUENDEL_UPLOAD_H_
#define QUENDEL_UPLOAD_H_

#include <json/value.h>

#include <vector>

#include "quendel/export.h"
#include "quendel/types.h"

// Carries out the server's request for files: prepares each file and sends all of them in one post.
//
// `files` is the server's list as it came: an array of at most five objects with the texts
// "file_type", "file_path" and "file_uuid".
//
//  * Type "coredump" asks for a crash dump, by its absolute path. The dump is sent compressed and
//    stays where it is.
//  * Type "debug.dat" asks for debug data collected on the spot; its path is ignored.
//
// Every path, "debug.dat" aside, must match "^(/var/crash/|/volume[0-9]+/)@.+\.core$", or nothing
// is prepared at all. The check is one of text alone: it does not resolve ".." or links. A path
// counts up to its first NUL. A file that cannot be prepared, or is of another type, only drops
// out. When every file drops out, and for an empty or null list, the server is told
// QUENDEL_ACT_PROGRESS_NO_FILE; no other progress is reported. `actionId` is the number that the
// server gave the request. With any progress but QUENDEL_ACT_PROGRESS_RUN nothing happens.
//
// Works below "/tmp/quendel", which must be no link and belong to the effective user, like what is
// used in it. Compresses a dump beside itself, so its directory needs the room. Of the directories
// "coredump" and "debugdat" the one used last is removed at the end; "/tmp/quendel/debugdat.zip"
// stays. Not for two calls at a time on one device.
//
// Returns 0 when the server accepted the files, or the report that there are none, and when there
// was nothing to do; else -1.
QUENDEL_EXPORT int QUENDELUploadFile(int actionId, QuendelActionProgress_t progress,
                                     const Json::Value& files);

// Sends files to the server in one post, as the answer to its request `actionId`, of which 7
// characters count. Each file goes with its name, type, uuid and timestamp; one that cannot be
// opened fails the whole post. An empty list is posted too. The files are left as they are.
//
// Needs a signed-in cloud account.
//
// Returns 0 when the server accepted the post, else -1.
QUENDEL_EXPORT int QUENDELSendUploadData(int actionId,
                                         const std::vector<QUENDELSendDataParam_t>& files);

// Prepares the local account `user` for the vendor's support staff: its home, "/run/quendelhome",
// belongs to user ID 50001 and group ID 100, and `key`, one or more lines of an OpenSSH
// authorized_keys file, opens it. The key is written as it stands, without a line end of its own;
// an empty one is allowed. A symbolic link in place of the key file or its directory is refused,
// and so is a key file that is not a plain file or has a second name.
//
// Calling it again writes another key, but what an earlier holder left in the home stays; call
// QUENDELSupportAccountUserDelete() first. Needs root.
//
// Returns 0, or -1 with whatever was made so far left in place; QUENDELSupportAccountUserDelete()
// clears it away.
QUENDEL_EXPORT int QUENDELSupportAccountUserCreate(const char* user, const char* key);

// Removes the support account's home, "/run/quendelhome", and then the local account `user`. Either
// may be gone already. Needs root.
//
// Returns 0 when the removal of the home was run and the account no longer exists, else -1.
QUENDEL_EXPORT int QUENDELSupportAccountUserDelete(const char* user);

// Ends a support session: deletes its account and home, reports `progress` for the server's request
// `actionId`, stops the ssh service if it was started for the session, and removes
// "/usr/arvo/etc/quendel.remote.conf".
//
// Whoever opens a session writes that file, a key=value file: "remote_account" is the account to
// delete (none when empty or missing); "stop_sshd_after_complete" is exactly "yes" when the ssh
// service is to be stopped. A service that cannot be stopped is logged and fails nothing.
//
// `progress` is QUENDEL_ACT_PROGRESS_DONE or QUENDEL_ACT_PROGRESS_FAILED; any other value is
// refused and changes nothing. The file goes last, so a call that failed can be repeated. Needs
// root.
//
// Returns 0 when the account is gone, the server was told and the removal of the file was run, else
// -1.
QUENDEL_EXPORT int QUENDELRemoteClose(int actionId, QuendelActionProgress_t progress);

// Reads the key of the current remote session from the platform's authentication tool, at most
// `size` bytes of what it prints.
//
// The bytes are raw: nothing is parsed, a line end is not taken off, and NO TERMINATING NUL IS
// ADDED. A caller that wants a text clears the whole buffer first and passes its size less one:
//
//   char key[129] = {};
//   if (QUENDELGetRemoteSessionKey(key, sizeof key - 1) == 0) { ... }
//
// When nothing could be read, buf is as the caller left it, and the log line shows it up to its
// first NUL or `size` bytes: pass no buffer that holds a secret. The key is one; keep it out of
// logs.
//
// Returns 0 when at least one byte was read, whatever the tool's exit status, else -1.
QUENDEL_EXPORT int QUENDELGetRemoteSessionKey(char* buf, int size);

#endif  // QUENDEL_UPLOAD_H_
