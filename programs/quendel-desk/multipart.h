// Takes a multipart/form-data body apart while it arrives.
#ifndef QUENDEL_DESK_MULTIPART_H_
#define QUENDEL_DESK_MULTIPART_H_

#include <optional>
#include <string>
#include <string_view>

namespace quendeldesk {

struct PartHead {
  std::string name;
  std::optional<std::string> filename;
  std::string content_type;
};

// What is done with the parts. Each gets any number of PartBytes between BeginPart and EndPart.
class PartSink {
 public:
  virtual ~PartSink() = default;
  virtual void BeginPart(const PartHead& head) = 0;
  virtual void PartBytes(std::string_view bytes) = 0;
  virtual void EndPart() = 0;
};

// The HTTP library has a reader of forms too, but it begins a part that is empty and one whose
// first bytes look like a boundary in the same way, so that two files become one.
class MultipartReader {
 public:
  MultipartReader(const std::string& boundary, PartSink& sink);

  // Takes the next bytes. Returns false once the body is no form, and from then on.
  bool Take(std::string_view bytes);

  // Tells whether the closing boundary has come.
  bool complete() const { return state_ == State::kComplete; }

 private:
  enum class State { kPreamble, kHead, kBody, kComplete, kBad };
  enum class Line { kNone, kUnknown, kNext, kLast };

  bool Step();
  bool FindBoundary();
  Line LineAfter(size_t at, size_t& size) const;
  bool ReadHead();
  void Emit(size_t size);

  const std::string delimiter_;
  PartSink& sink_;
  State state_ = State::kPreamble;
  std::string buffer_;
};

// Returns the boundary that a request's Content-Type names, or an empty text when it is no form.
std::string BoundaryOf(const std::string& contentType);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_MULTIPART_H_
