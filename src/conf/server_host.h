// The name of the service's server, without a copy.
#ifndef CONF_SERVER_HOST_H_
#define CONF_SERVER_HOST_H_

namespace quendel {

// Returns what QUENDELGetServerHost() returns. It needs no memory, so it never fails: a URL that
// lacked its host would lead to a machine that is named like the path behind it.
const char* ServerHost();

}  // namespace quendel

#endif  // CONF_SERVER_HOST_H_
