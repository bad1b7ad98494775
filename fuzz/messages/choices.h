// SPDX-License-Identifier: Apache-2.0
/// The input of a fuzzer as a row of decisions: what is made of it changes little where little of
/// the input does. When the input is used up every decision is 0, so that whatever is made ends.
///
/// One thread at a time.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace Keelgate::Fuzz {

class Choices {
 public:
  explicit Choices(std::span<const std::uint8_t> input) : rest_(input) {}

  [[nodiscard]] bool isEmpty() const { return rest_.empty(); }

  std::uint8_t byte() {
    if (rest_.empty()) return 0;
    const std::uint8_t first = rest_.front();
    rest_ = rest_.subspan(1);
    return first;
  }
  /// 0 to `count` - 1.
  std::size_t below(std::size_t count) { return byte() % count; }
  /// True once in `often` times.
  bool rarely(std::size_t often) { return below(often) == often - 1; }

  /// Of one to eight bytes, so that every magnitude is as likely as the others.
  std::uint64_t number() {
    std::uint64_t value = 0;
    for (std::size_t bytes = below(9); bytes > 0; --bytes) value = value << 8 | byte();
    return rarely(4) ? ~value : value;
  }

  /// UTF-8 with characters of every length and the edges of each. Seldom one that XML does not
  /// have: of a text with those only binary messages can be made.
  std::string text() {
    static constexpr std::u32string_view edges =
        U"<&>\"\\\t\x7f\x80\x9f\x7ff\x800\x2028\xd7ff\xe000\xfffd\x10000\x10ffff";
    std::string text;
    for (std::size_t length = below(24); length > 0; --length) {
      const std::uint8_t choice = byte();
      if (choice == 255 && rarely(32)) {
        append(text, byte() % 32u);
      } else {
        append(text, choice < 64 ? edges[choice % edges.size()] : char32_t{choice} / 2);
      }
    }
    return text;
  }

  /// All that is left.
  std::span<const std::uint8_t> rest() {
    const auto all = rest_;
    rest_ = {};
    return all;
  }

 private:
  static void append(std::string& text, char32_t character) {
    const auto put = [&](char32_t bits) {
      text += static_cast<char>(bits);
    };
    if (character < 0x80) {
      put(character);
    } else if (character < 0x800) {
      put(0xC0 | character >> 6);
      put(0x80 | (character & 0x3F));
    } else if (character < 0x10000) {
      put(0xE0 | character >> 12);
      put(0x80 | (character >> 6 & 0x3F));
      put(0x80 | (character & 0x3F));
    } else {
      put(0xF0 | character >> 18);
      put(0x80 | (character >> 12 & 0x3F));
      put(0x80 | (character >> 6 & 0x3F));
      put(0x80 | (character & 0x3F));
    }
  }

  std::span<const std::uint8_t> rest_;
};

}  // namespace Keelgate::Fuzz
