// What a reset writes.
#ifndef COLLECTORS_RESET_VALUE_H_
#define COLLECTORS_RESET_VALUE_H_

namespace quendel {

// Two double quotes, not an empty value: the key stays present for the next reader. The text is no
// MD5 and no inode, and reads as the number 0.
inline constexpr char kResetValue[] = "\"\"";

}  // namespace quendel

#endif  // COLLECTORS_RESET_VALUE_H_
