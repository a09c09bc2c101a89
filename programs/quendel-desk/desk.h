// What the parts of a running desk share.
#ifndef QUENDEL_DESK_DESK_H_
#define QUENDEL_DESK_DESK_H_

#include <memory>
#include <string>

#include "http.h"
#include "objects.h"
#include "rate_limit.h"
#include "records.h"
#include "store.h"
#include "workers.h"

namespace quendeldesk {

constexpr uint64_t kMiB = 1024UL * 1024;

struct Settings {
  std::string data;
  std::string device_address;  // empty: every one
  uint16_t device_port = 51790;
  uint16_t people_port = 51791;
  std::string host = "support.test";  // in the certificate
  Enrolment enrolment = Enrolment::kOpen;
  uint64_t most_upload_mib = 8192;
  uint64_t least_free_mib = 1024;
  unsigned per_device = 600;  // requests a minute
  unsigned per_address = 0;   // likewise; 0 is without limit, as one address can be a fleet
  unsigned threads = 0;       // 0: as many as there are processors
  ConnectionLimits connections;
  HttpLimits http;
};

// The database and the files below a folder. Only one desk serves them; the command line may look
// and change beside it.
struct Archive {
  explicit Archive(const std::string& folder);

  // Settles or removes the objects that a crash left unsettled, and removes what is discarded.
  void Recover();

  // Removes the objects that no row names any more.
  void RemoveDiscarded();

  const std::string folder;
  const std::unique_ptr<Objects> objects;
  Store store;
};

struct Desk {
  explicit Desk(const Settings& s);

  // The workers go first, once their work is done: it needs the archive.
  const Settings settings;
  Archive archive;
  Workers files;    // for what waits for an object to be on the disk
  Workers lookups;  // for what reads the database for a device
  Workers queries;  // for what programs ask
  RateLimit per_device;
  RateLimit per_address;
};

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_DESK_H_
