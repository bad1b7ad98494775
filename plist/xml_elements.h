// SPDX-License-Identifier: Apache-2.0
// The elements of XML property lists, and how their tags are told apart.
//
// No name is longer than seven letters, so a name and its '>' fit a word: a tag as writers spell
// it is found by a look-up and one comparison. Any other spelling is left to the scanner.
//
// Constants and pure functions; may be used from any thread.
#pragma once

#include <algorithm>
#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace PropertyList {

// All that a property list may have below its root. `yes` and `no` stand for what is spelt as the
// keywords of C++.
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

// At most eight characters, as they lie in a word of memory.
struct ShortText {
  std::uint64_t bits;
  std::uint64_t mask;
  std::size_t length;

  constexpr explicit ShortText(std::string_view text) noexcept
      : bits(0), mask(0), length(text.size()) {
    std::array<char, 8> characters{};
    std::array<unsigned char, 8> places{};
    std::copy(text.begin(), text.end(), characters.begin());
    std::fill_n(places.begin(), length, 0xFF);
    bits = std::bit_cast<std::uint64_t>(characters);
    mask = std::bit_cast<std::uint64_t>(places);
  }
  // Whether a word of memory begins with it.
  constexpr bool begins(std::uint64_t word) const noexcept { return (word & mask) == bits; }
};

// The texts behind the '<' and the "</" of tags without white space or attributes. A tag that is
// spelt otherwise is as good, and slower.
struct Spelling {
  std::string_view name;
  // What follows '<' and "</" in the tags of most writers.
  ShortText start;
  ShortText end;
};

// In the order of the enumerators. The two booleans are empty elements.
inline constexpr std::array<Spelling, 10> spellings = {
    {{"string", ShortText("string>"), ShortText("string>")},
     {"key", ShortText("key>"), ShortText("key>")},
     {"integer", ShortText("integer>"), ShortText("integer>")},
     {"real", ShortText("real>"), ShortText("real>")},
     {"date", ShortText("date>"), ShortText("date>")},
     {"data", ShortText("data>"), ShortText("data>")},
     {"true", ShortText("true/>"), ShortText("true>")},
     {"false", ShortText("false/>"), ShortText("false>")},
     {"array", ShortText("array>"), ShortText("array>")},
     {"dict", ShortText("dict>"), ShortText("dict>")}}};

constexpr const Spelling& spellingOf(Element element) noexcept {
  return spellings[static_cast<std::size_t>(element)];
}

// Tells the elements apart by the first four characters: a multiplication gives each a slot of its
// own, and the compiler looks for the factor. A message cannot make it slow: there is one
// multiplication for any word, and no list to search.
class ElementTable {
 public:
  constexpr ElementTable() noexcept {
    while (!fill()) factor_ *= factor_;
  }
  // The only element whose start tag can have this word after its '<'.
  constexpr Element candidate(std::uint64_t word) const noexcept { return slots_[slot(word)]; }

 private:
  static constexpr std::uint64_t firstFour = ShortText("four").mask;

  // The highest five bits of the product: all of the four characters have a say in them.
  constexpr std::size_t slot(std::uint64_t word) const noexcept {
    return static_cast<std::size_t>((word & firstFour) * factor_ >> 59);
  }
  // Whether this factor keeps all ten apart. If none did, the program would not compile.
  constexpr bool fill() noexcept {
    std::array<bool, 32> taken{};
    for (std::size_t i = 0; i < spellings.size(); ++i) {
      const std::size_t at = slot(spellings[i].start.bits);
      if (taken[at]) return false;
      taken[at] = true;
      slots_[at] = static_cast<Element>(i);
    }
    return true;
  }

  std::uint64_t factor_ = 0x9E37'79B9'7F4A'7C15;
  // A slot that nobody has holds the first element. That does no harm: a candidate is compared.
  std::array<Element, 32> slots_{};
};

inline constexpr ElementTable elementTable;

}  // namespace PropertyList
