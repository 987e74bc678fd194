#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

// The two text forms of a vCard 3.0 value (RFC 2426) that the contacts file uses.
namespace zt::contacts {

// Leaves in `slot` the value as a card writes it: line feeds and carriage returns become
// "\n" each (so CR LF gives two), ";" becomes "\;" and "," becomes "\,". Backslashes and
// colons stay as they are. The slot is reused from call to call to spare allocations.
void escapeVCardText(std::string_view source, std::string& slot);

// Appends the base64 block of a binary value (RFC 2426 section 5, "b" encoding): the standard
// padded base64 text cut into lines of 76 characters, each written as a space, the line and
// CR LF, so the block folds onto the lines that follow its property. No bytes give CR LF alone.
void appendBase64Block(std::string& out, std::span<const std::uint8_t> bytes);

}  // namespace zt::contacts
