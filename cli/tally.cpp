// SPDX-License-Identifier: Apache-2.0
#include "cli/tally.h"

#include <fmt/format.h>

#include <numeric>

namespace Keelgate::CLI {

namespace {

using Reason = HostError::Reason;

constexpr std::size_t place(Reason reason) {
  return static_cast<std::size_t>(reason);
}

/// With a comma between thousands.
String grouped(UInt64 number) {
  String digits = fmt::format("{}", number);
  for (std::size_t at = digits.size(); at > 3;) digits.insert(at -= 3, ",");
  return digits;
}

}  // namespace

void Tally::count(const JSON::Reply& reply) {
  const std::lock_guard lock(mutex_);
  bytes_ += JSON::sizeOf(reply.json);
  if (reply.reason) {
    ++givenUp_[place(*reply.reason)];
  } else if (reply.outcome == JSON::Outcome::record) {
    ++records_;
  } else if (reply.outcome == JSON::Outcome::rejected) {
    ++rejected_;
  } else {
    ++unusable_;
  }
}

UInt64 Tally::givenUp() const {
  return std::accumulate(givenUp_.begin(), givenUp_.end(), UInt64{0});
}

String Tally::sentence() const {
  const std::lock_guard lock(mutex_);
  const UInt64 messages = records_ + rejected_ + givenUp();
  const UInt64 crashed = givenUp_[place(Reason::crashed)];
  const UInt64 timedOut = givenUp_[place(Reason::timedOut)];
  String sentence = fmt::format("{} message{}", grouped(messages), messages == 1 ? "" : "s");
  const auto add = [&](UInt64 number, const char* what) {
    if (number > 0) sentence += fmt::format(", {} {}", grouped(number), what);
  };
  add(rejected_, "rejected");
  add(crashed, "crashed");
  add(timedOut, "timed out");
  add(givenUp() - crashed - timedOut, "failed");
  const std::chrono::duration<double> time = std::chrono::steady_clock::now() - begin_;
  return sentence + fmt::format(", {:.2f} s", time.count());
}

String Tally::metrics() const {
  const std::lock_guard lock(mutex_);
  String text =
      "# HELP keelgate_messages_total Messages answered, by what became of them.\n"
      "# TYPE keelgate_messages_total counter\n";
  const auto add = [&](std::string_view outcome, UInt64 number) {
    text += fmt::format("keelgate_messages_total{{outcome=\"{}\"}} {}\n", outcome, number);
  };
  add("record", records_);
  add("rejected", rejected_);
  for (const auto& [name, number] : casesOf<Reason>) add(name, givenUp_[number]);
  const auto addCounter = [&](std::string_view name, std::string_view help, UInt64 number) {
    text += fmt::format("# HELP keelgate_{0} {1}\n# TYPE keelgate_{0} counter\nkeelgate_{0} {2}\n",
                        name, help, number);
  };
  addCounter("invalid_requests_total", "Lines that were not valid requests.", unusable_);
  addCounter("reply_bytes_total", "Bytes of all replies.", bytes_);
  return text;
}

}  // namespace Keelgate::CLI
