// Where the files that devices send are kept.
#ifndef QUENDEL_DESK_OBJECTS_H_
#define QUENDEL_DESK_OBJECTS_H_

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "descriptor.h"

namespace quendeldesk {

struct StoredObject {
  std::string name;  // of lower-case letters, digits, '-' and '/'
  uint64_t size = 0;
  std::string sha256;
};

// An object that is being written. Unless it is kept, nothing is left of it.
class ObjectWriter {
 public:
  virtual ~ObjectWriter() = default;
  virtual void Write(std::string_view bytes) = 0;

  // Returns when the object would survive a power cut. It is unsettled.
  virtual StoredObject Keep() = 0;
};

// An object is written before the database names it, so a crash in between would leave it to
// nobody. Therefore it is unsettled until Settle is called, which is when the database has been
// told; at the start each unsettled object is settled if the database names it, else removed.
class Objects {
 public:
  virtual ~Objects() = default;

  virtual std::unique_ptr<ObjectWriter> Create() = 0;
  virtual void Settle(const std::string& name) = 0;
  virtual std::vector<std::string> Unsettled() const = 0;

  // Removes an object, settled or not; a name without an object is fine.
  virtual void Remove(const std::string& name) = 0;

  // Opens an object for reading. Throws when there is none.
  virtual Descriptor Open(const std::string& name) const = 0;

  // Writes an object that comes from elsewhere under the name that it has there.
  virtual void Import(const std::string& name, int file) = 0;

  // Calls `visit` with the name of each object.
  virtual void ForEach(const std::function<void(const std::string& name)>& visit) const = 0;

  virtual uint64_t FreeBytes() const = 0;
};

// Objects as files in a folder, which is made if there is none.
std::unique_ptr<Objects> OpenFolderObjects(const std::string& folder);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_OBJECTS_H_
