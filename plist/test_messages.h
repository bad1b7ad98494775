// SPDX-License-Identifier: Apache-2.0
/// Messages made by hand, for the tests of plist/.
#pragma once

#include "plist/tree_of.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace PropertyList {

inline Bytes bytesOf(std::string_view text) {
  return std::as_bytes(std::span(text));
}

// A string with zero bytes in it: bytes("\x10\x00") has length 2.
template <std::size_t N>
std::string bytes(const char (&literal)[N]) {
  return {literal, N - 1};
}

inline std::string bigEndian(std::uint64_t number, std::size_t width) {
  std::string out;
  for (std::size_t i = width; i-- > 0;) out.push_back(static_cast<char>(number >> (8 * i)));
  return out;
}

// A binary property list with these objects as they stand, the first one on top.
struct Raw {
  std::vector<std::string> objects;
  std::size_t referenceSize = 1;
  std::size_t offsetSize = 4;

  std::string message() const {
    std::string out = "bplist00";
    std::string table;
    for (const std::string& object : objects) {
      table += bigEndian(out.size(), offsetSize);
      out += object;
    }
    const std::size_t tableStart = out.size();
    return out + table + trailer(tableStart);
  }
  std::string trailer(std::uint64_t tableStart) const {
    return bytes("unused") + bigEndian(offsetSize, 1) + bigEndian(referenceSize, 1) +
           bigEndian(objects.size(), 8) + bigEndian(0, 8) + bigEndian(tableStart, 8);
  }
};

inline std::string binary(std::vector<std::string> objects) {
  return Raw{std::move(objects)}.message();
}

inline std::string xml(std::string_view content) {
  return "<plist>" + std::string(content) + "</plist>";
}

/// Keys of eight printable characters that have one hash, made by undoing its steps.
inline std::vector<std::string> keysOfOneHash(std::size_t count) {
  constexpr std::uint64_t factor = 0x9e37'79b9'7f4a'7c15;
  std::uint64_t inverse = 1;
  for (int i = 0; i < 6; ++i) inverse *= 2 - factor * inverse;
  std::vector<std::string> keys;
  for (std::uint64_t low = 0; keys.size() < count; ++low) {
    const std::uint64_t digest = (std::uint64_t{0x1234'5678} << 32 | low) * inverse;
    // The highest bit of a digest is set, whatever the key.
    if (digest >> 63 == 0) continue;
    const std::uint64_t mixed = digest * inverse;
    const std::uint64_t word = ((mixed ^ mixed >> 32) * inverse) ^ (8 * factor);
    if ((word & 0x8080'8080'8080'8080) != 0) continue;
    std::string key;
    for (unsigned shift = 0; shift < 64; shift += 8) key += static_cast<char>(word >> shift);
    if (std::ranges::all_of(key, [](char c) { return c >= ' '; })) keys.push_back(std::move(key));
  }
  return keys;
}

/// For the messages of a failed expectation.
inline void PrintTo(Problem problem, std::ostream* out) {
  *out << reason(problem);
}

/// What is wrong with a message; nothing where it is read.
inline std::optional<Problem> problemIn(std::string_view message) {
  try {
    const Document document(bytesOf(message));
    return std::nullopt;
  } catch (const MalformedDocument& error) {
    EXPECT_LE(error.offset(), message.size());
    return error.problem();
  }
}

inline std::optional<Problem> problemIn(const std::vector<std::byte>& message) {
  return problemIn({reinterpret_cast<const char*>(message.data()), message.size()});
}

inline Tree read(std::string_view message) {
  return treeOf(bytesOf(message));
}

}  // namespace PropertyList
