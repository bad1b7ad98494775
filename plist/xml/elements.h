// SPDX-License-Identifier: Apache-2.0
/// The elements of XML property lists, and how their names are told apart.
///
/// No name is longer than seven letters, so it fits a word of memory: it is found by a look-up and
/// one comparison.
///
/// Constants and pure functions; may be used from any thread.
#pragma once

#include "plist/key_hash.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace PropertyList {

/// All that a property list may have below its root. `yes` and `no` stand for what is spelt as the
/// keywords of C++.
enum class Element : std::uint8_t {
  string,
  key,
  integer,
  real,
  date,
  data,
  yes,
  no,
  array,
  dictionary
};

/// At most eight characters, as they lie in a word that is loaded least byte first.
struct ShortText {
  std::uint64_t bits = 0;
  std::uint64_t mask = 0;
  std::size_t length;

  constexpr explicit ShortText(std::string_view text) noexcept : length(text.size()) {
    for (std::size_t i = 0; i < length; ++i) {
      bits |= std::uint64_t{static_cast<unsigned char>(text[i])} << (8 * i);
      mask |= std::uint64_t{0xff} << (8 * i);
    }
  }
  /// Whether a word of memory begins with it.
  constexpr bool begins(std::uint64_t word) const noexcept { return (word & mask) == bits; }
};

inline constexpr ShortText rootName("plist");

/// In the order of the enumerators. The two booleans are empty elements.
inline constexpr std::array<ShortText, 10> elementNames = {
    ShortText("string"), ShortText("key"),  ShortText("integer"), ShortText("real"),
    ShortText("date"),   ShortText("data"), ShortText("true"),    ShortText("false"),
    ShortText("array"),  ShortText("dict")};

constexpr const ShortText& nameOf(Element element) noexcept {
  return elementNames[static_cast<std::size_t>(element)];
}

/// Tells the elements apart by their first three characters: a multiplication gives each a slot of
/// its own, and the compiler looks for the factor. A message cannot make it slow: there is one
/// multiplication for any word, and no list to search.
class ElementTable {
 public:
  constexpr ElementTable() noexcept {
    while (!fill()) factor_ *= factor_;
  }
  /// The only element whose name can begin this word.
  constexpr Element candidate(std::uint64_t word) const noexcept {
    const Element element = slots_[slot(word)];
    // "dat" alone is not enough.
    return element == Element::data && (word >> 24 & 0xff) == 'e' ? Element::date : element;
  }

 private:
  constexpr std::size_t slot(std::uint64_t word) const noexcept {
    return static_cast<std::size_t>((word & 0xff'ffff) * factor_ >> 59);
  }
  /// Whether this factor keeps all apart. If none did, the program would not compile.
  constexpr bool fill() noexcept {
    std::array<bool, 32> taken{};
    for (std::size_t i = 0; i < elementNames.size(); ++i) {
      const auto element = static_cast<Element>(i);
      if (element == Element::date) continue;
      const std::size_t at = slot(nameOf(element).bits);
      if (taken[at]) return false;
      taken[at] = true;
      slots_[at] = element;
    }
    return true;
  }

  std::uint64_t factor_ = 0x9e37'79b9'7f4a'7c15;
  /// A slot that nobody has holds the first element. That does no harm: a candidate is compared.
  std::array<Element, 32> slots_{};
};

inline constexpr ElementTable elementTable;

}  // namespace PropertyList
