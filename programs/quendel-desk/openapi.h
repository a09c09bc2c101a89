// The description of the programs' interface.
#ifndef QUENDEL_DESK_OPENAPI_H_
#define QUENDEL_DESK_OPENAPI_H_

namespace quendeldesk {

extern const char kOpenApi[];

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_OPENAPI_H_
