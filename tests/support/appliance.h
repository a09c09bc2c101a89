// The files of the appliance that a test runs on. Each test has an appliance of its own, so it
// writes the real paths and leaves them as they are.
#ifndef TESTS_SUPPORT_APPLIANCE_H_
#define TESTS_SUPPORT_APPLIANCE_H_

#include <map>
#include <string>

namespace quendel::test {

// Each of these ends the test program with a sentence when it cannot do its work.

// Creates or replaces a file, and the folders above it.
void WriteFile(const std::string& path, const std::string& text);

// Returns the file's bytes.
std::string ReadFile(const std::string& path);

// Tells whether there is anything at this path, be it a link that leads nowhere.
bool Exists(const std::string& path);

// Removes a file, or a folder with all that is in it; a path with nothing at it is fine.
void RemoveFile(const std::string& path);

// Gives the device an identity, "/usr/arvo/etc/device.conf": exactly these keys and values.
void SetIdentity(const std::map<std::string, std::string>& values);

// Gives it the standard one: serial number S1, account mail1 with the fields a1 and b2, zone
// Etc/UTC.
void SetIdentity();

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_APPLIANCE_H_
