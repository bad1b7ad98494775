// SPDX-License-Identifier: Apache-2.0
/// Base64 (RFC 4648, section 4) with full padding.
///
/// Pure functions; may be used from any thread.
#pragma once

#include <cstddef>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace Keelgate::Text {

/// `strict` has one spelling for each list of bytes. `spaced` allows white space anywhere, and any
/// value of the bits before the padding that belong to no byte.
enum class Base64 { strict, spaced };

/// In bytes, of the text for so many bytes.
constexpr std::size_t base64Length(std::size_t size) noexcept {
  return (size + 2) / 3 * 4;
}

/// To where `out` has room for all of the text.
void encodeBase64(std::span<const std::byte> bytes, char* out) noexcept;
/// Throws std::bad_alloc.
std::string encodeBase64(std::span<const std::byte> bytes);

/// Room in bytes for what a text of this length decodes to.
constexpr std::size_t base64Room(std::size_t textLength) noexcept {
  return textLength / 4 * 3 + 3;
}

/// Decodes all of the text and returns how many bytes were written, or nothing where it is not
/// base64. `out` has base64Room(text.size()) bytes or is where the text is: no byte is written
/// before its characters are read.
std::optional<std::size_t> decodeBase64(std::string_view text, char* out, Base64 form) noexcept;

}  // namespace Keelgate::Text
