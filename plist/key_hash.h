// SPDX-License-Identifier: Apache-2.0
/// The hash of dictionary keys. The same at compile time, so that tables of fields can be made with
/// it: whoever looks a key up has its hash from the document.
///
/// Pure functions; may be used from any thread.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>
#include <type_traits>

namespace PropertyList {

/// The first bytes of the text as a number, least significant first. The text must have them.
template <std::size_t bytes>
constexpr std::uint64_t loadWord(std::string_view text) noexcept {
  std::uint64_t word = 0;
  if (std::is_constant_evaluated() || std::endian::native != std::endian::little) {
    for (std::size_t i = 0; i < bytes; ++i) {
      word |= std::uint64_t{static_cast<unsigned char>(text[i])} << (8 * i);
    }
  } else {
    std::memcpy(&word, text.data(), bytes);
  }
  return word;
}

/// All of the key has a say in all bits. It has no secret: whoever wants keys with one hash can
/// have them, and no look-up may rely on there being few.
constexpr std::uint32_t keyHash(std::string_view key) noexcept {
  constexpr std::uint64_t factor = 0x9e37'79b9'7f4a'7c15;
  std::uint64_t hash = key.size() * factor;
  const auto add = [&hash](std::uint64_t word) {
    hash = (hash ^ word) * factor;
    hash ^= hash >> 32;
  };
  const std::size_t size = key.size();
  if (size >= 8) {
    for (; key.size() > 8; key.remove_prefix(8)) add(loadWord<8>(key));
    // What is left, and as much before it as makes a word.
    add(loadWord<8>({key.data() + key.size() - 8, 8}));
  } else if (size >= 4) {
    add(loadWord<4>(key) | loadWord<4>(key.substr(size - 4)) << 32);
  } else if (size > 0) {
    add(loadWord<1>(key) | loadWord<1>(key.substr(size / 2)) << 8 |
        loadWord<1>(key.substr(size - 1)) << 16);
  }
  // The upper half, in which all of the last word has a say.
  return static_cast<std::uint32_t>(hash * factor >> 32);
}

}  // namespace PropertyList
