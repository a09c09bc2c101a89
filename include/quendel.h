// libquendel: the device side of the remote support service.
//
// Everything a caller may use is declared in the headers below. Unless a function says otherwise:
//
//  * it returns 0 for success and -1 for failure, and has logged the reason of a failure once, with
//    syslog at LOG_ERR, as "<unit>:<line> <message>";
//  * it throws nothing;
//  * texts are NUL-terminated bytes in the encoding of the file they come from (UTF-8 on the
//    appliance); sizes are bytes and times are whole seconds since 1970-01-01 00:00:00 UTC;
//  * it blocks until it is done, and no time-out limits an exchange with the server.
//
// The connection to the server is encrypted but the server is not authenticated: treat what it
// sends as untrusted.
#ifndef QUENDEL_H_
#define QUENDEL_H_

#include "quendel/collect.h"
#include "quendel/collectors.h"
#include "quendel/conf.h"
#include "quendel/conversation.h"
#include "quendel/transport.h"
#include "quendel/types.h"
#include "quendel/upload.h"
#include "quendel/version.h"

#endif  // QUENDEL_H_
