// Bytes from anywhere, made safe to show.
#ifndef QUENDELCTL_PRINTABLE_H_
#define QUENDELCTL_PRINTABLE_H_

#include <string>
#include <string_view>

namespace quendelctl {

// Returns the text with everything escaped that could act on a terminal or deceive its reader:
// control characters, those that turn the direction of writing or are not seen, and bytes that are
// not UTF-8. They become \x1b for a byte and \u{202e} for a character beyond ASCII. Characters in
// `keep` stay.
std::string Printable(std::string_view text, std::string_view keep = "");

}  // namespace quendelctl

#endif  // QUENDELCTL_PRINTABLE_H_
