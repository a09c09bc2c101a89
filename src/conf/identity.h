// Who the device is to the server: its serial number and its owner's cloud account.
#ifndef CONF_IDENTITY_H_
#define CONF_IDENTITY_H_

#include <cstddef>
#include <cstdlib>
#include <memory>
#include <string>

namespace quendel {

// Reads the device's serial number, at most 35 bytes. Returns false when the platform has none.
bool ReadSerialNumber(std::string& serialNumber);

// The signed-in cloud account. The record is large and is the platform's own, so it lives on the
// heap and goes with this object.
class AccountRecord {
 public:
  AccountRecord();

  // False when there was no memory for the record; nothing below may be called then.
  explicit operator bool() const { return record_ != nullptr; }

  // Asks the platform for the account. Returns false when none is signed in.
  bool Fill();

  std::string email() const;
  std::string field_a() const;
  std::string field_b() const;

 private:
  struct Free {
    void operator()(char* record) const { free(record); }
  };

  std::string TextAt(size_t offset) const;

  std::unique_ptr<char, Free> record_;
};

}  // namespace quendel

#endif  // CONF_IDENTITY_H_
