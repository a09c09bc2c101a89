// The commands that hand a block of bytes from one process to another.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <charconv>
#include <climits>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <system_error>
#include <utility>

#include "arguments.h"
#include "command.h"
#include "quendel.h"

namespace quendelctl {
namespace {

// System V keys are shown in hexadecimal, where a negative one has its highest bit set.
int ReadKey(const std::string& text) {
  uint32_t bits = 0;
  int key = 0;
  if (text.rfind("0x", 0) != 0) {
    key = ReadNumber("KEY", text);
  } else {
    const char* end = text.data() + text.size();
    const auto [stop, error] = std::from_chars(text.data() + 2, end, bits, 16);
    if (error != std::errc() || stop != end) {
      throw CLI::ValidationError("KEY", text + " is not a number that fits 32 bits");
    }
    key = static_cast<int>(bits);
  }
  if (key == 0) {
    throw CLI::ValidationError("KEY", "0 is no key: nobody would find the segment");
  }
  return key;
}

int ReadSize(const std::string& text) {
  const int size = ReadNumber("SIZE", text);
  if (size < 1) {
    throw CLI::ValidationError("SIZE", text + " is not a size");
  }
  return size;
}

// The first byte of a segment tells how the exchange stands.
std::string ReadBlock(const std::string& file) {
  std::string block = ReadText("FILE", file, INT_MAX);
  if (block.empty()) {
    throw CLI::ValidationError("FILE", "must have at least 1 byte");
  }
  if (block[0] == '\0' || block[0] == '*') {
    throw CLI::ValidationError("FILE", "must begin neither with a zero byte nor with *");
  }
  return block;
}

void AddKeyAndSize(Result& result, int key, size_t size) {
  result.members["key"] = key;
  result.members["size"] = static_cast<Json::UInt64>(size);
}

struct AllocArguments {
  std::string key;
  std::string size;
  bool hold = false;
};

Result Alloc(const AllocArguments& arguments) {
  const int key = ReadKey(arguments.key);
  const int size = ReadSize(arguments.size);
  Result result;
  result.success = QUENDELShmAlloc(static_cast<size_t>(size), key) == 0;
  result.lines = {result.success ? "The segment is there." : "The segment could not be made."};
  result.keeps_process = result.success && arguments.hold;
  AddKeyAndSize(result, key, static_cast<size_t>(size));
  return result;
}

void DeclareKey(CLI::App& command, std::string& key) {
  command.add_option("KEY", key, "Number of the segment, decimal or hexadecimal as in 0x51")
      ->required()
      ->type_name("");
}

Action DeclareAlloc(CLI::App& command) {
  const auto arguments = std::make_shared<AllocArguments>();
  DeclareKey(command, arguments->key);
  command.add_option("SIZE", arguments->size, "Its size in bytes")->required()->type_name("");
  command.add_flag("--hold", arguments->hold,
                   "Stay attached to it until a signal ends the program");
  return [arguments] { return Alloc(*arguments); };
}

struct SendArguments {
  std::string key;
  std::string file = "-";
};

// Tells a reader what a result of the library means.
std::string Describe(int code, const char* success, const char* failure) {
  return code == 0 ? success : code == -2 ? "There is no such segment of that size." : failure;
}

Result Send(const SendArguments& arguments) {
  const int key = ReadKey(arguments.key);
  std::string block = ReadBlock(arguments.file);
  const int code = QUENDELShmSend(block.data(), block.size(), key);
  Result result;
  result.success = code == 0;
  result.lines = {Describe(code, "The block was received.", "The block was not received.")};
  AddKeyAndSize(result, key, block.size());
  result.members["result"] = code;
  return result;
}

Action DeclareSend(CLI::App& command) {
  const auto arguments = std::make_shared<SendArguments>();
  DeclareKey(command, arguments->key);
  command
      .add_option("FILE", arguments->file,
                  "What holds the block, the standard input if not given or -; it must\n"
                  "begin neither with a zero byte nor with *")
      ->type_name("");
  return [arguments] { return Send(*arguments); };
}

struct ReceiveArguments {
  std::string key;
  std::string size;
  std::string file = "-";
};

// The file that a block goes to. It is opened before the block is received, as that cannot be had
// twice, and left as it was when none is.
class Target {
 public:
  explicit Target(const std::string& name)
      : name_(name),
        file_(name == "-" ? -1 : open(name.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0666)) {
    if (file_ < 0 && name != "-") {
      Fail();
    }
  }
  ~Target() {
    if (file_ >= 0) {
      close(file_);
    }
  }
  Target(const Target&) = delete;
  Target& operator=(const Target&) = delete;

  bool is_standard_output() const { return file_ < 0; }

  void Write(const char* block, size_t size) {
    struct stat status;
    if (fstat(file_, &status) != 0 || (S_ISREG(status.st_mode) && ftruncate(file_, 0) != 0)) {
      Fail();
    }
    while (size > 0) {
      const ssize_t written = write(file_, block, size);
      if (written < 0) {
        Fail();
      }
      block += written;
      size -= static_cast<size_t>(written);
    }
    if (close(std::exchange(file_, -1)) != 0) {
      Fail();
    }
  }

 private:
  [[noreturn]] void Fail() const {
    throw std::system_error(errno, std::generic_category(), "cannot write " + name_);
  }

  std::string name_;
  int file_;
};

struct Free {
  void operator()(char* memory) const { free(memory); }
};

Result Receive(const ReceiveArguments& arguments) {
  const int key = ReadKey(arguments.key);
  const auto size = static_cast<size_t>(ReadSize(arguments.size));
  const std::unique_ptr<char, Free> block(static_cast<char*>(calloc(size, 1)));
  if (block == nullptr) {
    throw std::bad_alloc();
  }
  Target target(arguments.file);
  const int code = QUENDELShmReceive(block.get(), size, key);
  Result result;
  result.success = code == 0;
  AddKeyAndSize(result, key, size);
  result.members["result"] = code;
  if (!result.success || !target.is_standard_output()) {
    result.lines = {Describe(code, "The block was received.", "No block was received.")};
  }
  if (!result.success) {
    return result;
  }
  if (!target.is_standard_output()) {
    target.Write(block.get(), size);
    return result;
  }
  std::string hex;
  QUENDELBytesToHex(hex, reinterpret_cast<const unsigned char*>(block.get()),
                    static_cast<int>(size));
  result.members["block_hex"] = hex;
  result.bytes.assign(block.get(), size);
  return result;
}

Action DeclareReceive(CLI::App& command) {
  const auto arguments = std::make_shared<ReceiveArguments>();
  DeclareKey(command, arguments->key);
  command.add_option("SIZE", arguments->size, "How many bytes to receive")
      ->required()
      ->type_name("");
  command
      .add_option("FILE", arguments->file,
                  "Where to write them, to the standard output if not given or -")
      ->type_name("");
  return [arguments] { return Receive(*arguments); };
}

Action DeclareShm(CLI::App& command) {
  return DeclareGroup(
      command,
      {
          {"alloc", "Make a segment, or find the one that has this key",
           R"(Examples:
  quendelctl shm alloc 0x51 4096
  quendelctl shm alloc 0x51 4096 --hold &)",
           DeclareAlloc},
          {"send", "Put a block into a segment and wait for its receiver",
           R"(Examples:
  quendelctl shm send 0x51 block.bin
  echo hello | quendelctl shm send 0x51)",
           DeclareSend},
          {"receive", "Wait for a block, show it, and remove the segment",
           R"(The bytes are printed as they are; a terminal gets those escaped that could act on it.

Examples:
  quendelctl shm receive 0x51 4096 block.bin
  quendelctl shm receive 0x51 6)",
           DeclareReceive},
      });
}

}  // namespace

std::vector<Command> ShmCommands() {
  return {{"shm", "Hand a block of bytes to another process of this device", "", DeclareShm}};
}

}  // namespace quendelctl
