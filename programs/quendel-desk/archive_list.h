// Looks into archives that devices sent, which may hold anything. Nothing of them is written
// anywhere.
#ifndef QUENDEL_DESK_ARCHIVE_LIST_H_
#define QUENDEL_DESK_ARCHIVE_LIST_H_

#include <json/value.h>

#include "descriptor.h"
#include "http.h"

namespace quendeldesk {

// Lists an archive: {"entries": [{"number", "path", "type", "size", "modified"}], "complete":
// true}. "complete" is false, with a "reason", when the archive is damaged or larger than is looked
// at.
Json::Value ListArchive(Descriptor file);

// Makes the bytes of the entry with a number of that list. Throws when there is no such file in it.
BodySource ReadArchiveEntry(Descriptor file, long long number);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_ARCHIVE_LIST_H_
