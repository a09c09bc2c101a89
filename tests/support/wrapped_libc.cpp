// The calls of the C library that pass through the kit; those of other libraries do not.
#include <dirent.h>
#include <fcntl.h>
#include <netdb.h>
#include <regex.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/sendfile.h>
#include <sys/shm.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <ctime>

#include "support/wrap.h"

using quendel::test::Count;
using quendel::test::Fd;

QUENDEL_WRAP(calloc, void*, (size_t count, size_t size), count, size);
QUENDEL_WRAP(chmod, int, (const char* path, mode_t mode), path, mode);
QUENDEL_WRAP(chown, int, (const char* path, uid_t owner, gid_t group), path, owner, group);
QUENDEL_WRAP(close, int, (int fd), Fd(fd));
QUENDEL_WRAP(closedir, int, (DIR * stream), stream);
QUENDEL_WRAP(connect, int, (int fd, const sockaddr* address, socklen_t size), Fd(fd), address,
             size);
QUENDEL_WRAP(copy_file_range, ssize_t,
             (int in, off64_t* inPlace, int out, off64_t* outPlace, size_t size, unsigned flags),
             Fd(in), inPlace, Fd(out), outPlace, Count(size), flags);
QUENDEL_WRAP(fchmod, int, (int fd, mode_t mode), Fd(fd), mode);
QUENDEL_WRAP(fdopen, FILE*, (int fd, const char* mode), Fd(fd), mode);
QUENDEL_WRAP(flock, int, (int fd, int operation), Fd(fd), operation);
QUENDEL_WRAP(fopen, FILE*, (const char* path, const char* mode), path, mode);
QUENDEL_WRAP(fork, pid_t, ());
QUENDEL_WRAP(fstat, int, (int fd, struct stat* status), Fd(fd), status);
QUENDEL_WRAP(fsync, int, (int fd), Fd(fd));
QUENDEL_WRAP(fputs, int, (const char* text, FILE* stream), text, stream);
QUENDEL_WRAP(ftruncate, int, (int fd, off_t size), Fd(fd), size);
QUENDEL_WRAP(gethostbyname, hostent*, (const char* name), name);
QUENDEL_WRAP(kill, int, (pid_t process, int number), process, number);
QUENDEL_WRAP(lseek, off_t, (int fd, off_t place, int from), Fd(fd), place, from);
QUENDEL_WRAP(mkdir, int, (const char* path, mode_t mode), path, mode);
QUENDEL_WRAP(mkdirat, int, (int directory, const char* name, mode_t mode), Fd(directory), name,
             mode);
QUENDEL_WRAP(nanosleep, int, (const timespec* wanted, timespec* left), wanted, left);
QUENDEL_WRAP(pread, ssize_t, (int fd, void* buf, size_t size, off_t place), Fd(fd), buf,
             Count(size), place);
QUENDEL_WRAP(pwrite, ssize_t, (int fd, const void* buf, size_t size, off_t place), Fd(fd), buf,
             Count(size), place);
QUENDEL_WRAP(regcomp, int, (regex_t * expression, const char* text, int flags), expression, text,
             flags);
QUENDEL_WRAP(remove, int, (const char* path), path);
QUENDEL_WRAP(rename, int, (const char* from, const char* to), from, to);
QUENDEL_WRAP(sendfile, ssize_t, (int out, int in, off_t* place, size_t size), Fd(out), Fd(in),
             place, Count(size));
QUENDEL_WRAP(shmat, void*, (int id, const void* address, int flags), id, address, flags);
QUENDEL_WRAP(shmctl, int, (int id, int command, shmid_ds* data), id, command, data);
QUENDEL_WRAP(shmdt, int, (const void* address), address);
QUENDEL_WRAP(shmget, int, (key_t key, size_t size, int flags), key, size, flags);
QUENDEL_WRAP(signal, sighandler_t, (int number, sighandler_t handler), number, handler);
QUENDEL_WRAP(socket, int, (int domain, int type, int protocol), domain, type, protocol);
QUENDEL_WRAP(stat, int, (const char* path, struct stat* status), path, status);
QUENDEL_WRAP(statx, int, (int fd, const char* path, int flags, unsigned mask, struct statx* status),
             Fd(fd), path, flags, mask, status);
QUENDEL_WRAP(time, time_t, (time_t * result), result);
QUENDEL_WRAP(unlink, int, (const char* path), path);
QUENDEL_WRAP(utimensat, int, (int directory, const char* path, const timespec* times, int flags),
             Fd(directory), path, times, flags);
QUENDEL_WRAP(waitpid, pid_t, (pid_t process, int* status, int options), process, status, options);
QUENDEL_WRAP(write, ssize_t, (int fd, const void* buf, size_t size), Fd(fd), buf, Count(size));

// Its mode is only there where it creates a file.
QUENDEL_WRAP_BY_HAND(openat, "openat");
extern "C" int __real_openat(int directory, const char* name, int flags, ...);
extern "C" int __wrap_openat(int directory, const char* name, int flags, ...);
int __wrap_openat(int directory, const char* name, int flags, ...) {
  va_list arguments;
  va_start(arguments, flags);
  const mode_t mode = (flags & (O_CREAT | __O_TMPFILE)) != 0 ? va_arg(arguments, mode_t) : 0;
  va_end(arguments);
  return quendel::test::PassCall<int(int, const char*, int, mode_t)>(
      wrapped_openat, __real_openat, Fd(directory), name, flags, mode);
}

// Its arguments depend on the option; those that tests care about have one number.
QUENDEL_WRAP_BY_HAND(prctl, "prctl");
extern "C" int __real_prctl(int option, ...);
extern "C" int __wrap_prctl(int option, ...);
int __wrap_prctl(int option, ...) {
  va_list arguments;
  va_start(arguments, option);
  const unsigned long value = va_arg(arguments, unsigned long);
  va_end(arguments);
  return quendel::test::PassCall<int(int, unsigned long)>(
      wrapped_prctl, [](int o, unsigned long v) { return __real_prctl(o, v, 0UL, 0UL, 0UL); },
      option, value);
}
