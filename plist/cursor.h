// SPDX-License-Identifier: Apache-2.0
/// The one place where pointers move over message bytes.
///
/// A cursor walks a window of a message and cannot leave it: every read is checked against the
/// window's end, and every amount that the message claims is compared with what remains before it
/// is added to anything, so that no claim can overflow. Binary reads throw MalformedDocument when
/// the window is too short; text reads see '\0' at the end, a character that no XML may hold.
///
/// A value; not for use by several threads at once. The message must outlive it.
#pragma once

#include "plist/bytes.h"
#include "plist/malformed_document.h"
#include "text/ascii.h"

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>

namespace PropertyList {

/// Cheap to copy: a copy is how a reader looks ahead, or goes back.
class Cursor {
 public:
  /// The whole message.
  explicit Cursor(Bytes message) noexcept : Cursor(message, 0, message.size()) {}
  /// The window [from, to) of the message, with from <= to <= its length.
  Cursor(Bytes message, std::size_t from, std::size_t to) noexcept
      : begin_(message.data()), here_(begin_ + from), end_(begin_ + to) {}

  /// Bytes from the message's beginning.
  std::size_t position() const noexcept { return static_cast<std::size_t>(here_ - begin_); }
  /// Bytes up to the window's end.
  std::size_t remaining() const noexcept { return static_cast<std::size_t>(end_ - here_); }

  /// Binary: each throws MalformedDocument(objectOutside) rather than leave the window.

  std::uint8_t byte() { return std::to_integer<std::uint8_t>(take(1)[0]); }
  /// The next `length` bytes, as a view into the message.
  Bytes take(std::uint64_t length) {
    if (length > remaining()) throw MalformedDocument(Problem::objectOutside, position());
    const Bytes taken(here_, static_cast<std::size_t>(length));
    here_ += length;
    return taken;
  }
  /// An unsigned number of 1 to 8 bytes, most significant first. Requires 8 bytes of message from
  /// here on, of which the window may have fewer.
  std::uint64_t bigEndian(std::size_t width) { return bigEndianAt(take(width), 0, width); }

  /// The number of `width` bytes (1 to 8) at `offset`. For what the caller has checked and what
  /// lies before the 32-byte trailer, so that 8 bytes can be loaded at once whatever the width.
  /// Requires 8 bytes of message from there on.
  static std::uint64_t bigEndianAt(Bytes message, std::size_t offset, std::size_t width) noexcept {
    std::uint64_t number;
    std::memcpy(&number, message.data() + offset, sizeof number);
    if constexpr (std::endian::native == std::endian::little) number = __builtin_bswap64(number);
    return number >> (64 - 8 * width);
  }
  /// The eight bytes at `offset`, the first one lowest.
  static std::uint64_t wordAt(Bytes message, std::size_t offset) noexcept {
    return __builtin_bswap64(bigEndianAt(message, offset, 8));
  }
  /// Zero where none of the bytes at `offset` is above 0x7f. Requires 32 bytes of message behind
  /// them.
  static std::uint64_t highBitsAt(Bytes message, std::size_t offset, std::size_t length) noexcept {
    Block seen{};
    for (; length > 2 * sizeof(Block); length -= sizeof(Block), offset += sizeof(Block)) {
      seen |= blockAt(message.data() + offset);
    }
    // Most texts are shorter: they are looked at without a branch, which could not be foreseen.
    const signed char* const marks = leadingMarks.data() + (2 * sizeof(Block) - length);
    seen |= blockAt(message.data() + offset) & blockAt(marks);
    seen |= blockAt(message.data() + offset + sizeof(Block)) & blockAt(marks + sizeof(Block));
    const auto words = std::bit_cast<std::array<std::uint64_t, 2>>(seen);
    return (words[0] | words[1]) & 0x8080'8080'8080'8080;
  }
  /// The view of `length` bytes at `offset`; both checked by the caller when the node was made.
  static std::string_view textAt(Bytes message, std::size_t offset, std::size_t length) noexcept {
    return {reinterpret_cast<const char*>(message.data() + offset), length};
  }

  /// Text: nothing throws.

  bool atEnd() const noexcept { return here_ == end_; }
  /// The byte so many places ahead, or '\0' beyond the end.
  char peek(std::size_t ahead = 0) const noexcept {
    return ahead < remaining() ? static_cast<char>(here_[ahead]) : '\0';
  }
  /// The eight bytes so many places ahead, the first one lowest; zero bytes beyond the end.
  std::uint64_t word(std::size_t ahead) const noexcept {
    std::uint64_t bytes = 0;
    if (remaining() >= ahead + sizeof bytes) {
      std::memcpy(&bytes, here_ + ahead, sizeof bytes);
    } else if (remaining() > ahead) {
      std::memcpy(&bytes, here_ + ahead, remaining() - ahead);
    }
    return std::endian::native == std::endian::little ? bytes : __builtin_bswap64(bytes);
  }
  /// All that is left of the window.
  std::string_view rest() const noexcept {
    return {reinterpret_cast<const char*>(here_), remaining()};
  }
  /// From an earlier position of this cursor up to here. The start may lie no further than here.
  std::string_view since(std::size_t start) const noexcept {
    return {reinterpret_cast<const char*>(begin_ + start), position() - start};
  }
  /// Moves on by at most what remains.
  void skip(std::size_t length) noexcept { here_ += length < remaining() ? length : remaining(); }
  /// Moves past the literal if it stands here; says whether it did. Case counts, as it does in XML.
  bool skipIf(std::string_view literal) noexcept {
    if (!rest().starts_with(literal)) return false;
    here_ += literal.size();
    return true;
  }
  /// Moves past white space as XML knows it; says whether there was any.
  bool skipSpace() noexcept {
    const std::byte* const start = here_;
    while (here_ != end_ && Text::isSpace(std::to_integer<char>(*here_))) ++here_;
    return here_ != start;
  }
  /// Moves to the next byte that text gives a meaning to or forbids: '<', '&', ']', a carriage
  /// return, another control character, or any byte above 0x7f. Or to the end.
  void skipPlain() noexcept {
    // Most texts are short: the first block is looked at where it is asked for.
    const std::size_t plain = remaining() >= sizeof(Block) ? plainPrefix() : 0;
    here_ += plain;
    if (plain == 0 || plain == sizeof(Block)) skipLongPlain();
  }

 private:
  /// Sixteen bytes in the compilers' portable vectors: one register where the machine has such.
  /// Signed, because that is what machines compare: the bytes above 0x7f are below zero.
  using Block [[gnu::vector_size(16)]] = signed char;

  static Block blockAt(const void* bytes) noexcept {
    Block block;
    std::memcpy(&block, bytes, sizeof block);
    return block;
  }
  /// From the place 32 - n on, n bytes of ones and then zeros.
  static constexpr auto leadingMarks = [] {
    std::array<signed char, 64> marks{};
    for (std::size_t i = 0; i < 32; ++i) marks[i] = -1;
    return marks;
  }();

  /// How many bytes come before the first that is not plain. Requires a block inside the window.
  std::size_t plainPrefix() const noexcept {
    const Block block = blockAt(here_);
    // Bytes above 0x7f are below a space too.
    const Block marks = ((block < ' ') & (block != '\n') & (block != '\t')) | (block == '<') |
                        (block == '&') | (block == ']');
    const auto words = std::bit_cast<std::array<std::uint64_t, 2>>(marks);
    return words[0] != 0 ? bytesBefore(words[0]) : 8 + bytesBefore(words[1]);
  }
  /// Eight for a word of zero.
  static std::size_t bytesBefore(std::uint64_t marks) noexcept {
    constexpr bool isLittle = std::endian::native == std::endian::little;
    const int bits = isLittle ? std::countr_zero(marks) : std::countl_zero(marks);
    return static_cast<std::size_t>(bits) / 8;
  }
  void skipLongPlain() noexcept;

  /// Always begin_ <= here_ <= end_.
  const std::byte* begin_;
  const std::byte* here_;
  const std::byte* end_;
};

}  // namespace PropertyList
