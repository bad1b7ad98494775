// SPDX-License-Identifier: Apache-2.0
/// What a worker of the fake service is told to do: the message that it is sent.
#pragma once

#include "framework/protocol/frames.h"
#include "framework/transport/record_coding.h"

#include <keelgate/records.h>

#include <string_view>

namespace Keelgate::Host {

/// The first three have bytes behind their step, the others milliseconds, a signal or a status in
/// it, or nothing. `answerZygote` gives the number of the process that the worker was forked from;
/// `trickle` sends a byte after the other for ever.
enum class Op : std::uint32_t {
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

struct Step {
  Op op;
  std::uint32_t amount;
};

/// Contexts whose command is one of these don't get as far as their script.
enum Interruption : std::uint64_t {
  none,
  ignoreBody = 1'000'001,
  answerBeforeBody,
  /// And the number of a signal.
  raiseAfterHeader = 2'000'000,
};

/// A record that can be told from others.
inline Data recordNumbered(Int number) {
  VespCommandResponse record{};
  record.command = number;
  record.applicationId = "application " + std::to_string(number);
  return Transport::lendRecord(record).joined();
}

class Script : public Data {
 public:
  Script& then(Op op, std::size_t amount = 0, Bytes behind = {}) {
    const Step step{.op = op, .amount = static_cast<std::uint32_t>(amount)};
    for (const Bytes part : {std::as_bytes(std::span(&step, 1)), behind}) {
      insert(end(), part.begin(), part.end());
    }
    return *this;
  }
  Script& write(Bytes bytes) { return then(Op::write, bytes.size(), bytes); }
  /// An honest record frame around the body.
  Script& answer(Bytes body) { return then(Op::answer, body.size(), body); }
  Script& answer(Int number) { return answer(recordNumbered(number)); }
  Script& log(std::string_view line) {
    return then(Op::log, line.size(), std::as_bytes(std::span(line)));
  }
};

}  // namespace Keelgate::Host
