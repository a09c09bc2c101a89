// The calls of the C library that a test can make fail.
#include <netdb.h>
#include <regex.h>
#include <signal.h>
#include <sys/shm.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <ctime>

#include "support/wrap.h"

QUENDEL_WRAP(void*, calloc, (size_t count, size_t size), count, size);
QUENDEL_WRAP(int, chmod, (const char* path, mode_t mode), path, mode);
QUENDEL_WRAP(int, chown, (const char* path, uid_t owner, gid_t group), path, owner, group);
QUENDEL_WRAP(int, connect, (int fd, const sockaddr* address, socklen_t size), fd, address, size);
QUENDEL_WRAP(int, fchmod, (int file, mode_t mode), file, mode);
QUENDEL_WRAP(FILE*, fdopen, (int fd, const char* mode), fd, mode);
QUENDEL_WRAP(FILE*, fopen, (const char* path, const char* mode), path, mode);
QUENDEL_WRAP(pid_t, fork, ());
QUENDEL_WRAP(hostent*, gethostbyname, (const char* name), name);
QUENDEL_WRAP(int, kill, (pid_t process, int number), process, number);
QUENDEL_WRAP(int, mkdir, (const char* path, mode_t mode), path, mode);
QUENDEL_WRAP(int, regcomp, (regex_t * expression, const char* text, int flags), expression, text,
             flags);
QUENDEL_WRAP(int, rename, (const char* from, const char* to), from, to);
QUENDEL_WRAP(void*, shmat, (int id, const void* address, int flags), id, address, flags);
QUENDEL_WRAP(int, shmctl, (int id, int command, shmid_ds* data), id, command, data);
QUENDEL_WRAP(int, shmdt, (const void* address), address);
QUENDEL_WRAP(int, shmget, (key_t key, size_t size, int flags), key, size, flags);
QUENDEL_WRAP(sighandler_t, signal, (int number, sighandler_t handler), number, handler);
QUENDEL_WRAP(int, socket, (int domain, int type, int protocol), domain, type, protocol);
QUENDEL_WRAP(time_t, time, (time_t * result), result);
QUENDEL_WRAP(int, unlink, (const char* path), path);
QUENDEL_WRAP(pid_t, waitpid, (pid_t process, int* status, int options), process, status, options);
