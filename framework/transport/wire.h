// SPDX-License-Identifier: Apache-2.0
/// The bytes of a reply's body: how values are written down, and the strict reader of them.
///
/// The reader faces a process that may be taken over. It accepts exactly one spelling of every
/// value, checks before it allocates, and allocates only what bytes at hand justify.
///
/// Values; one thread at a time.
#pragma once

#include <keelgate/values.h>

#include <cstddef>
#include <cstring>
#include <exception>
#include <string_view>

namespace Keelgate::Transport {

/// Thrown by Reader: the bytes are none that an honest service writes.
class MalformedReply : public std::exception {
 public:
  [[nodiscard]] const char* what() const noexcept override { return "malformed reply"; }
};

/// Throws std::bad_alloc. Trusts its caller: it runs in the service, and the reader checks in the
/// client what it wrote.
class Writer {
 public:
  /// Room for most replies, in place of growing there byte by byte.
  Writer() { out_.reserve(512); }
  void byte(std::uint8_t value) { out_.push_back(std::byte{value}); }
  void word(std::uint64_t value) { append(&value, sizeof value); }
  /// Behind their length, so that no octet needs escaping.
  void octets(Bytes value) {
    word(value.size());
    append(value.data(), value.size());
  }
  void text(std::string_view value) {
    octets(std::as_bytes(std::span(value.data(), value.size())));
  }
  [[nodiscard]] Data take() && { return std::move(out_); }

 private:
  // Through void*, so that a number is written as it lies in memory.
  void append(const void* from, std::size_t size) {
    const auto* bytes = static_cast<const std::byte*>(from);
    out_.insert(out_.end(), bytes, bytes + size);
  }

  Data out_;
};

/// Every function that takes something throws MalformedReply where there is not that much. Views
/// that it gives point into the reply and live as long.
class Reader {
 public:
  /// `memory`: what the values that are read may take in all, in bytes.
  Reader(Bytes reply, std::size_t memory) : rest_(reply), memory_(memory) {}

  std::uint8_t byte() { return static_cast<std::uint8_t>(take(1)[0]); }
  /// In the machine's order: both sides are on one machine.
  std::uint64_t word() {
    std::uint64_t value;
    std::memcpy(&value, take(sizeof value).data(), sizeof value);
    return value;
  }
  /// A flag is 0 or 1 and nothing else.
  bool flag() {
    const std::uint8_t value = byte();
    if (value > 1) throw MalformedReply();
    return value == 1;
  }
  /// A view into the reply.
  Bytes octets() { return take(word()); }
  /// The same, checked to be UTF-8.
  std::string_view text();
  /// How many elements follow; each takes one byte at least. So a count never makes more be set
  /// aside than has arrived.
  std::size_t count() {
    const std::uint64_t value = word();
    if (value > rest_.size()) throw MalformedReply();
    return value;
  }
  /// Accounts for so much memory that is taken for a value. A record may be twenty times as large
  /// as the shortest bytes that claim to be one.
  void charge(std::size_t size) {
    if (size > memory_) throw MalformedReply();
    memory_ -= size;
  }
  /// An honest reply ends where its record ends.
  void end() const {
    if (!rest_.empty()) throw MalformedReply();
  }

 private:
  // Everything that is read comes through here.
  Bytes take(std::uint64_t size) {
    // Compared, not added to a position: no length that a liar announces can wrap.
    if (size > rest_.size()) throw MalformedReply();
    const Bytes taken = rest_.first(size);
    rest_ = rest_.subspan(size);
    return taken;
  }

  Bytes rest_;
  std::size_t memory_;
};

}  // namespace Keelgate::Transport
