// SPDX-License-Identifier: Apache-2.0
#include "framework/transport/wire.h"

#include "text/utf8.h"

#include <algorithm>
#include <numeric>

namespace Keelgate::Transport {

namespace {

/// What the allocator keeps beside each block, and what it rounds up to.
constexpr std::size_t blockHeader = 8;
constexpr std::size_t blockStep = 16;
constexpr std::size_t smallestBlock = 32;

/// What is longer costs more to copy than to be written by a call of its own.
constexpr std::size_t longestCopied = std::size_t{16} << 10;

constexpr unsigned readsPerClock = 1024;

}  // namespace

std::size_t Body::size() const noexcept {
  return std::accumulate(
      loans.begin(), loans.end(), bytes.size(),
      [](std::size_t sum, const Loan& loan) { return sum + loan.octets.size(); });
}

Data Body::joined() && {
  if (loans.empty()) return std::move(bytes);
  Data all;
  all.reserve(size());
  eachPart([&](Bytes part) { all.insert(all.end(), part.begin(), part.end()); });
  return all;
}

void Writer::octets(Bytes value) {
  word(value.size());
  if (value.size() > longestCopied) {
    loans_.push_back({.position = size_, .octets = value});
  } else if (!value.empty()) {
    std::memcpy(room(value.size()), value.data(), value.size());
  }
}

void Writer::grow(std::size_t size) {
  out_.resize(std::max(2 * out_.size(), size_ + size));
}

Data Reader::octets() {
  const Bytes bytes = take(word());
  if (!bytes.empty()) charge(bytes.size());
  return {bytes.begin(), bytes.end()};
}

std::string_view Reader::text() {
  const Bytes bytes = take(word());
  const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
  if (!Text::isUtf8(text)) throw MalformedReply();
  // A short one lies within its String.
  if (text.size() > String().capacity()) charge(text.size() + 1);
  return text;
}

std::size_t Reader::count(std::size_t smallestElement) {
  const std::uint64_t value = word();
  if (value > rest_.size() / smallestElement) throw MalformedReply();
  return value;
}

void Reader::charge(std::size_t size) {
  // Compared before it is rounded up, so that nothing can wrap.
  if (size <= limits_.memory) {
    const std::size_t block = (size + blockHeader + blockStep - 1) / blockStep * blockStep;
    const std::size_t cost = std::max(block, smallestBlock);
    if (cost <= limits_.memory) {
      limits_.memory -= cost;
      return;
    }
  }
  throw ReadLimitReached(ReadLimitReached::Limit::memory);
}

void Reader::checkTime() {
  untilClock_ = readsPerClock;
  if (std::chrono::steady_clock::now() >= limits_.deadline) {
    throw ReadLimitReached(ReadLimitReached::Limit::time);
  }
}

}  // namespace Keelgate::Transport
