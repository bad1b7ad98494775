// SPDX-License-Identifier: Apache-2.0
/// The bytes of a reply's body: how values are written down, and the strict reader of them.
///
/// The reader faces a process that may be taken over. It accepts exactly one spelling of every
/// value, checks before it allocates, allocates only what bytes at hand justify, and keeps within
/// the memory and the time that the message is worth.
///
/// Values; one thread at a time.
#pragma once

#include "framework/contracts/memory_budget.h"

#include <keelgate/values.h>

#include <chrono>
#include <cstddef>
#include <cstring>
#include <exception>
#include <string_view>

namespace Keelgate::Transport {

/// Thrown by Reader: no honest service writes these bytes.
class MalformedReply : public std::exception {
 public:
  [[nodiscard]] const char* what() const noexcept override { return "malformed reply"; }
};

/// Thrown by Reader: the reply is well-formed so far, and to go on would cost more than is allowed.
class ReadLimitReached : public std::exception {
 public:
  enum class Limit { memory, time };
  explicit ReadLimitReached(Limit which) : limit(which) {}
  [[nodiscard]] const char* what() const noexcept override { return "reading costs too much"; }

  Limit limit;
};

/// What reading a reply may cost.
struct ReadLimits {
  /// Bytes that the values may take in all: every block that is allocated for them is charged.
  std::size_t memory = memoryBudget(0);
  /// Looked at while reading: a reply can be made to take long to read.
  std::chrono::steady_clock::time_point deadline = std::chrono::steady_clock::time_point::max();
};

/// So many containers of a property list stand in one another, and so many at most what a reply
/// brings. A service that was taken over must not get any deeper into the client's stack than an
/// honest one.
constexpr int maximumNesting = 512;

/// The body of a reply, in parts: what is long is borrowed from where it lies, and never copied. As
/// good as what was written lives.
struct Body {
  struct Loan {
    /// Behind so many of `bytes`.
    std::size_t position;
    Bytes octets;
  };
  Data bytes;
  Array<Loan> loans;

  [[nodiscard]] std::size_t size() const noexcept;
  /// Calls `visitor(Bytes)` for each part.
  template <class Visitor>
  void eachPart(Visitor visitor) const {
    std::size_t begin = 0;
    for (const auto& [position, octets] : loans) {
      visitor(Bytes(bytes).subspan(begin, position - begin));
      visitor(octets);
      begin = position;
    }
    visitor(Bytes(bytes).subspan(begin));
  }
  /// In one piece, with nothing on loan.
  [[nodiscard]] Data joined() &&;
};

/// Throws std::bad_alloc. Trusts its caller: it runs in the service, and the reader checks in the
/// client what it wrote.
class Writer {
 public:
  void byte(std::uint8_t value) { *room(1) = std::byte{value}; }
  /// As it lies in memory.
  void word(std::uint64_t value) { std::memcpy(room(sizeof value), &value, sizeof value); }
  /// Behind their length, so that no octet needs escaping. Long ones are borrowed, and have to
  /// outlive the body.
  void octets(Bytes value);
  void text(std::string_view value) {
    octets(std::as_bytes(std::span(value.data(), value.size())));
  }
  [[nodiscard]] Body take() && {
    out_.resize(size_);
    return {.bytes = std::move(out_), .loans = std::move(loans_)};
  }

 private:
  std::byte* room(std::size_t size) {
    if (size > out_.size() - size_) grow(size);
    std::byte* const place = out_.data() + size_;
    size_ += size;
    return place;
  }
  void grow(std::size_t size);

  /// Most replies have room in what is there at first.
  static constexpr std::size_t firstRoom = 4096;

  /// What lies behind `size_` is not written yet.
  Data out_ = Data(firstRoom);
  std::size_t size_ = 0;
  Array<Body::Loan> loans_;
};

/// Every function that takes something throws MalformedReply where there is not that much, and
/// ReadLimitReached. Views that it gives point into the reply and live as long.
class Reader {
 public:
  Reader(Bytes reply, const ReadLimits& limits) : rest_(reply), limits_(limits) {}

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
  /// A copy of what follows its length, charged.
  Data octets();
  /// A view of the same, checked to be UTF-8 and charged as the String that will be made of it.
  std::string_view text();
  /// How many elements follow, each of at least so many bytes. So a count never makes more be set
  /// aside than has arrived.
  std::size_t count(std::size_t smallestElement);
  /// Accounts for a block of so many bytes that is about to be allocated. A record may be twenty
  /// times as large as the shortest bytes that claim to be one.
  void charge(std::size_t size);
  /// An honest reply ends where its record ends.
  void end() const {
    if (!rest_.empty()) throw MalformedReply();
  }

 private:
  /// Everything that is read comes through here.
  Bytes take(std::uint64_t size) {
    // Compared, not added to a position: no length that is announced can wrap.
    if (size > rest_.size()) throw MalformedReply();
    if (untilClock_-- == 0) checkTime();
    const Bytes taken = rest_.first(size);
    rest_ = rest_.subspan(size);
    return taken;
  }
  void checkTime();

  Bytes rest_;
  ReadLimits limits_;
  /// Until the clock is looked at again, which costs as much as reading some twenty values.
  unsigned untilClock_ = 0;
};

}  // namespace Keelgate::Transport
