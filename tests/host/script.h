// SPDX-License-Identifier: Apache-2.0
/// What a worker of the fake service is told to do: the message that it is sent.
#pragma once

#include "framework/protocol/frames.h"
#include "framework/transport/record_coding.h"

#include <keelgate/records.h>

#include <cstring>
#include <string_view>

namespace Keelgate::Host {

enum class Op : std::uint8_t {
  write,
  answer,
  log,
  pause,
  raise,
  raiseIfUsed,
  hitZygote,
  answerZygote,
  trickle,
  exit,
  endless
};

/// Behind it stand `amount` bytes for write, answer and log; for the others it is the milliseconds,
/// the signal or the status. `answerZygote` gives the number of the process that the worker was
/// forked from; `trickle` sends a byte after the other for so long.
struct Step {
  Op op;
  std::uint32_t amount;
};

/// Contexts whose command is one of these don't get as far as their script.
enum Interruption : std::uint64_t {
  ignoreBody = 1'000'001,
  answerBeforeBody = 1'000'002,
  /// And the number of a signal.
  raiseAfterHeader = 2'000'000,
};

/// A record that can be told from others.
inline Data recordNumbered(Int number) {
  VespCommandResponse record{};
  record.command = number;
  record.applicationId = "application " + std::to_string(number);
  return Transport::encodeRecord(record);
}

/// Builds a script, step by step.
class Script {
 public:
  Script& write(Bytes bytes) { return add(Op::write, bytes); }
  /// An honest record frame around the body.
  Script& answer(Bytes body) { return add(Op::answer, body); }
  Script& log(std::string_view line) {
    return add(Op::log, std::as_bytes(std::span(line.data(), line.size())));
  }
  Script& then(Op op, std::uint32_t amount = 0) {
    put(Step{.op = op, .amount = amount});
    return *this;
  }
  Script& frame(Protocol::ReplyHeader header, Bytes body) {
    const Bytes head = std::as_bytes(std::span(&header, 1));
    Data whole(head.begin(), head.end());
    whole.insert(whole.end(), body.begin(), body.end());
    return write(whole);
  }
  operator Bytes() const { return bytes_; }

 private:
  Script& add(Op op, Bytes bytes) {
    put(Step{.op = op, .amount = static_cast<std::uint32_t>(bytes.size())});
    bytes_.insert(bytes_.end(), bytes.begin(), bytes.end());
    return *this;
  }
  void put(Step step) {
    const Bytes bytes = std::as_bytes(std::span(&step, 1));
    bytes_.insert(bytes_.end(), bytes.begin(), bytes.end());
  }

  Data bytes_;
};

}  // namespace Keelgate::Host
