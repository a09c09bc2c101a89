// The service's settings and the facts of the device.
#ifndef QUENDEL_CONF_H_
#define QUENDEL_CONF_H_

#include <cstddef>
#include <ctime>
#include <string>

#include "quendel/export.h"
#include "quendel/types.h"

// The platform's string-to-string hash, declared in full by the platform.
struct ALIBSZHASH;

// Reads the service's configuration, "/usr/arvo/etc/quendel.conf", anew at each call.
//
// conf->contact becomes the JSON under the key "contact", whatever kind of value it is. A missing
// file, a missing or empty key and a text that is not JSON all give an empty array, silently.
//
// Returns 0, or -1 with *conf as it was when memory ran out or the file exists but cannot be read.
QUENDEL_EXPORT int QUENDELGetConf(QUENDELConf_t* conf);

// The host name of the service's server, without scheme, port or path: key "quendel_server" of
// "/etc.defaults/arvoinfo.conf", of which the first 31 bytes count.
//
// The file is read at the first call only. What that read gave stays for the life of the process;
// if it gave nothing, that is the host built into the library. Safe to call from several threads.
//
// Returns the host name, or an empty text when memory ran out.
QUENDEL_EXPORT std::string QUENDELGetServerHost();

// Tells whether the service daemon, "quendeld", is configured to run on this device.
//
// Returns the platform's own answer: non-zero when the daemon is enabled, 0 when it is not.
QUENDEL_EXPORT int QUENDELIsEnable();

// Looks a key up in a platform hash, which is not changed.
//
// Returns a copy of the value, or an empty text when the hash does not have the key or memory ran
// out.
QUENDEL_EXPORT std::string QUENDELGetHashValue(ALIBSZHASH* hash, const char* key);

// Writes the device's model name into buf: key "upnpmodelname" of "/etc.defaults/arvoinfo.conf", of
// which the first 63 bytes count. The text is cut to size - 1 bytes and always NUL-terminated. A
// missing key gives an empty text and is not an error.
//
// In every case the platform's file lock 0x800 is released before the function returns.
//
// Returns 0, or -1 with buf untouched when the file cannot be read.
QUENDEL_EXPORT int QUENDELGetHMXModel(char* buf, size_t size);

// Writes the version of the operating system into buf, for a reader: "HMX 3.1-1021", or
// "HMX 3.1-1021 Update 7" when an update is installed. The parts are the keys "majorversion",
// "minorversion", "buildnumber" and "smallfixnumber" of "/etc.defaults/VERSION". An update counts
// as installed when "smallfixnumber" is there and is anything but exactly "0". A missing key or
// file leaves its places empty. The text is cut to size - 1 bytes and always NUL-terminated.
//
// Returns 0, or -1 with buf untouched when memory ran out.
QUENDEL_EXPORT int QUENDELGetHMXVersion(char* buf, size_t size);

// Writes a moment as compact local time, "20240305_070809" for 2024-03-05 07:08:09, cut to size - 1
// bytes and always NUL-terminated. Uses the process's time zone. Not safe to call from several
// threads at once.
//
// Returns the length of the full text (15 for a year of four digits), which is at least `size` when
// the text was cut; or -1, with an empty text, for a moment that has no calendar date.
QUENDEL_EXPORT int QUENDELGetLocalTime(char* buf, size_t size, time_t when);

// Finds a work directory name that no directory has yet, "/tmp/quendel_20240305_070809_0": the
// local time of `when` and the first number, counted from 0, that is free. A file of that name does
// not make it taken. The directory is not created, so two processes can find the same name; not
// safe to call from several threads at once. `size` is at least 1; the text is cut to size - 1
// bytes and always NUL-terminated; 64 bytes are enough.
//
// Returns the platform's answer for the name found: 0, or negative when the platform could not
// tell; or 1 when the name was cut and a directory has the name that is left.
QUENDEL_EXPORT int QUENDELGetDstDir(char* buf, size_t size, time_t when);

// Small helpers for files and texts. None of them logs.

// Copies one regular file, whole, to dst, which is created or overwritten.
//
// Returns the platform's own answer: 0 when the file was copied, else negative.
QUENDEL_EXPORT int QUENDELFileCopy(const char* src, const char* dst);

// Makes a directory and those above it that are missing, with the system's mkdir. `mode` is the
// mode of the last of them; of its octal text the first seven digits count. Nothing is done for
// exactly "." and exactly "/".
//
// Whether the directory was made is not told: a tool that ran and failed counts as success.
//
// Returns 0, or -1 when the tool could not be run.
QUENDEL_EXPORT int QUENDELRecursiveMkdir(const char* path, unsigned int mode);

// Removes a file, or a directory with all it holds, with the system's rm. Nothing is done for
// exactly "." and exactly "/".
//
// Whether anything was removed is not told: a tool that ran and failed counts as success.
//
// Returns 0, or -1 when the tool could not be run.
QUENDEL_EXPORT int QUENDELRecursiveRmdir(const char* path);

// Writes the MD5 of all bytes of a text, NUL bytes included, into out: 32 lowercase hexadecimal
// digits and a NUL, so out has room for at least 33 bytes. Returns nothing; never fails.
QUENDEL_EXPORT void QUENDELMD5String(const std::string& text, char* out);

// Replaces `out` by the two lowercase hexadecimal digits of each of `len` bytes; it becomes empty
// when `len` is 0 or negative, and when memory ran out. Returns nothing.
QUENDEL_EXPORT void QUENDELBytesToHex(std::string& out, const unsigned char* bytes, int len);

// Writes the byte of each two hexadecimal digits, of either case, into out, up to `maxlen` bytes. A
// last digit without a partner is a byte of its own. A pair that is no number is read as far as
// strtol reads it: "zz" gives 0x00, "1z" gives 0x01, "-1" gives 0xff.
//
// The caller knows the number of bytes, half the digits rounded up, from the text. Returns nothing;
// never fails.
QUENDEL_EXPORT void QUENDELHexToBytes(const std::string& hex, unsigned char* out, int maxlen);

#endif  // QUENDEL_CONF_H_
