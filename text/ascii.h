// SPDX-License-Identifier: Apache-2.0
/// Classes of ASCII characters. No locale has a say in any of them.
///
/// Pure functions; may be used from any thread.
#pragma once

namespace Keelgate::Text {

constexpr bool isDigit(char c) noexcept {
  return c >= '0' && c <= '9';
}

constexpr bool isLetter(char c) noexcept {
  return (c | 0x20) >= 'a' && (c | 0x20) <= 'z';
}

/// White space as XML and base64 know it.
constexpr bool isSpace(char c) noexcept {
  return c == ' ' || c == '\n' || c == '\t' || c == '\r';
}

constexpr char lowerCase(char c) noexcept {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c | 0x20) : c;
}

/// The value of a hexadecimal digit in either case, or -1.
constexpr int hexDigit(char c) noexcept {
  if (isDigit(c)) return c - '0';
  const char letter = lowerCase(c);
  return letter >= 'a' && letter <= 'f' ? letter - 'a' + 10 : -1;
}

}  // namespace Keelgate::Text
