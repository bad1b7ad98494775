// SPDX-License-Identifier: Apache-2.0
/// What the subcommands that start a service share.
#pragma once

#include "cli/console.h"
#include "cli/tally.h"
#include "framework/json/reply.h"

#include <keelgate/client.h>

#include <cstddef>
#include <vector>

namespace Keelgate::CLI {

/// A running service, whose log goes to the console. May be used from many threads at once.
class Host {
 public:
  /// For at most so many messages at a time. The console must outlive it. Throws HostError
  /// (startFailed).
  Host(Client::Options options, Console& console, std::size_t maximumMessages = SIZE_MAX);

  [[nodiscard]] JSON::Reply answer(const JSON::Subject& subject, Bytes message,
                                   const JSON::Form& form) const;

  /// One for each of the service's processes, so that none of them is idle.
  [[nodiscard]] std::size_t threads() const { return options_.processes; }
  /// In bytes.
  [[nodiscard]] std::size_t largestMessage() const { return options_.largestMessage; }
  [[nodiscard]] ServiceReport report() const { return client_.report(); }

 private:
  Client::Options options_;
  mutable Client client_;
};

/// Takes the replies of one run, in their order: prints them, says what went wrong and notes the
/// exit status. For one thread at a time.
class Delivery {
 public:
  /// Whether a rejected message is a fault of the run, or an answer like any other.
  enum class Kind { files, stream };

  /// `total`: how many replies there will be, where that is known.
  Delivery(Console& console, Tally& tally, Kind kind, std::size_t total = 0)
      : console_(console), tally_(tally), kind_(kind), total_(total) {}

  /// False when no more replies are wanted.
  Bool take(const std::vector<JSON::Reply>& due) noexcept;

  [[nodiscard]] std::size_t taken() const { return taken_; }

 private:
  void say(const JSON::Reply& reply);

  Console& console_;
  Tally& tally_;
  Kind kind_;
  std::size_t total_;
  std::size_t taken_ = 0;
};

}  // namespace Keelgate::CLI
