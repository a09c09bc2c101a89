// What tests put on the device, and ask of it.
#ifndef TESTS_SUPPORT_DEVICE_H_
#define TESTS_SUPPORT_DEVICE_H_

#include <sys/stat.h>

#include <cstdint>
#include <string>

namespace quendel::test {

inline constexpr char kConfFolder[] = "/usr/arvo/etc/quendel";

// Installs a log collector that has collected nothing yet. Returns the path of its configuration
// file, "/usr/arvo/etc/quendel/quendel.log." and the name.
std::string InstallLog(const std::string& name, const std::string& path);

// Installs a user-defined collector that has delivered nothing yet: the shell script, as
// "/volume1/" and the name. Returns the path of its configuration file,
// "/usr/arvo/etc/quendel/quendel.udc." and the name.
std::string InstallUdc(const std::string& name, const std::string& script);

// Makes a tool of the appliance this shell script.
void InstallTool(const std::string& path, const std::string& script);

void AppendFile(const std::string& path, const std::string& text);

// Moves the log's archives up by one number, makes its text archive 1, and leaves the log as a new
// empty file (Rotate) or as the old one, emptied (CopyTruncate).
void Rotate(const std::string& log);
void CopyTruncate(const std::string& log);

// The path of a log's archive.
std::string ArchiveOf(const std::string& log, int number);

// What stat() tells of a file that must be there; of that, its type and permissions
// (S_IFREG | 0600), and its inode number.
struct stat StatusOf(const std::string& path);
mode_t ModeOf(const std::string& path);
uint64_t InodeOf(const std::string& path);

// How many descriptors this process has open.
int OpenDescriptors();

// The hash that the library gives a text.
std::string Md5Of(const std::string& text);

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_DEVICE_H_
