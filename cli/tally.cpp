// SPDX-License-Identifier: Apache-2.0
#include "cli/tally.h"

#include <fmt/format.h>

namespace Keelgate::CLI {

namespace {

/// With a comma between thousands.
String grouped(UInt64 number) {
  String digits = fmt::format("{}", number);
  for (std::size_t at = digits.size(); at > 3;) digits.insert(at -= 3, ",");
  return digits;
}

}  // namespace

void Tally::count(const JSON::Reply& reply) noexcept {
  bytes_ += JSON::sizeOf(reply.json);
  if (reply.reason) {
    messages_.count(*reply.reason);
  } else if (reply.status == JSON::Status::done) {
    messages_.countRecord();
  } else if (reply.status == JSON::Status::rejected) {
    messages_.countRejection();
  } else {
    ++unusable_;
  }
}

String Tally::sentence() const {
  const Statistics all = messages_.read();
  String sentence =
      fmt::format("{} message{}", grouped(all.messages), all.messages == 1 ? "" : "s");
  const auto add = [&](UInt64 number, const char* what) {
    if (number > 0) sentence += fmt::format(", {} {}", grouped(number), what);
  };
  add(all.rejections, "rejected");
  add(all.crashed, "crashed");
  add(all.timedOut, "timed out");
  add(all.messages - all.records - all.rejections - all.crashed - all.timedOut, "failed");
  const std::chrono::duration<double> time = std::chrono::steady_clock::now() - begin_;
  return sentence + fmt::format(", {:.2f} s", time.count());
}

String Tally::metrics() const {
  const Statistics all = messages_.read();
  String text =
      "# HELP keelgate_messages_total Messages answered, by what became of them.\n"
      "# TYPE keelgate_messages_total counter\n";
  const auto add = [&](std::string_view outcome, UInt64 number) {
    text += fmt::format("keelgate_messages_total{{outcome=\"{}\"}} {}\n", outcome, number);
  };
  add("record", all.records);
  add("rejected", all.rejections);
  for (const auto& [name, number] : casesOf<HostError::Reason>) {
    add(name, messages_.of(static_cast<HostError::Reason>(number)));
  }
  const auto addCounter = [&](std::string_view name, std::string_view help, UInt64 number) {
    text += fmt::format("# HELP keelgate_{0} {1}\n# TYPE keelgate_{0} counter\nkeelgate_{0} {2}\n",
                        name, help, number);
  };
  addCounter("invalid_requests_total", "Lines that were not valid requests.", unusable_);
  addCounter("reply_bytes_total", "Bytes of all replies.", bytes_);
  return text;
}

}  // namespace Keelgate::CLI
