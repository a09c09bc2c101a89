// Owners of the platform's containers: what they hold is freed when they go.
#ifndef PLATFORM_OWNED_H_
#define PLATFORM_OWNED_H_

#include "platform/hash.h"
#include "platform/list.h"

namespace platform {

// Owns one container. get() is the container, null when it could not be made; slot() is the place
// that holds it, for the operations that may move it.
template <typename Container, Container* (*Alloc)(int), void (*Free)(Container*)>
class Owned {
 public:
  explicit Owned(int size) : container_(Alloc(size)) {}
  ~Owned() { Free(container_); }
  Owned(const Owned&) = delete;
  Owned& operator=(const Owned&) = delete;

  explicit operator bool() const { return container_ != nullptr; }
  Container* get() const { return container_; }
  Container** slot() { return &container_; }

 private:
  Container* container_;
};

using OwnedHash = Owned<ALIBSZHASH, ALIBCSzHashAlloc, ALIBCSzHashFree>;
using OwnedList = Owned<ALIBSZLIST, ALIBCSzListAlloc, ALIBCSzListFree>;

}  // namespace platform

#endif  // PLATFORM_OWNED_H_
