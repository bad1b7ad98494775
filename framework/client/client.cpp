// SPDX-License-Identifier: Apache-2.0
/// The public face: limits are checked, a pool is asked, and what it says is turned into a record
/// or thrown. Everything with threads in it is the pool's.
#include <keelgate/client.h>

#include "framework/client/pool.h"
#include "framework/contracts/layers.h"
#include "framework/protocol/control_frames.h"
#include "framework/transport/error_coding.h"
#include "framework/transport/record_coding.h"
#include "framework/transport/wire.h"
#include "text/utf8.h"

#include <algorithm>
#include <atomic>
#include <thread>

namespace Keelgate {

using Reason = HostError::Reason;
using VespKeelgateService::VespClientMessageUnpackingError;

namespace {

/// More could not be in work on any machine, and each costs a process or two.
constexpr std::size_t mostProcesses = 128;

/// Positions in a message are kept in 32 bits by whoever reads it.
constexpr std::size_t messageCeiling = 0xffff'ffff;

std::size_t processesFor(const Client::Options& options) {
  const std::size_t wanted =
      options.processes == 0 ? std::thread::hardware_concurrency() : options.processes;
  return std::clamp<std::size_t>(wanted, 1, mostProcesses);
}

Client::Options bounded(Client::Options options) {
  options.largestMessage = std::min(options.largestMessage, messageCeiling);
  return options;
}

}  // namespace

class Client::Implementation {
 public:
  explicit Implementation(Options options)
      : options_(bounded(std::move(options))), pool_(makePool().release()) {}

  ~Implementation() {
    Pool* pool = pool_.load();
    if (pool->isOurs()) {
      delete pool;
    } else {
      pool->abandon();
    }
  }
  Implementation(const Implementation&) = delete;
  Implementation& operator=(const Implementation&) = delete;

  template <OutputRecord R>
  R unpack(Bytes message, const VespClientMessageContext& context) {
    // First of all, so that nothing that follows goes uncounted.
    const Deadline deadline = deadlineAfter(options_.timeLimit);
    checkSize("the message", message.size(), options_.largestMessage);
    checkSize("the service identifier", context.service.size(), Protocol::maximumServiceLength);
    // What is not UTF-8 could not travel, and the table of services has none such.
    if (!Text::isUtf8(context.service)) {
      throw VespClientMessageUnpackingError::noUnpackerForService(context.service);
    }
    Optional<R> record;
    ours().exchange({.record = static_cast<std::uint16_t>(recordNumber<R>),
                     .command = context.command,
                     .service = context.service,
                     .message = message},
                    deadline, [&](const ReceivedReply& reply) {
                      if (reply.kind == Protocol::ReplyKind::error) {
                        Transport::throwError(reply.body,
                                              {.memory = reply.memory, .deadline = deadline});
                      }
                      // Within the call, so that a reply that turns out to be none ends its worker.
                      record = Transport::decodeRecord<R>(
                          reply.body, {.memory = reply.memory, .deadline = deadline});
                    });
    return std::move(*record);
  }

  ServiceReport report() {
    const auto [version, layers] = ours().report(deadlineAfter(options_.timeLimit));
    ServiceReport report{.version = Protocol::versionText(version), .layers = {}};
    for (const NamedLayer& row : namedLayers) {
      report.layers.push_back({.name = String(row.name), .present = (layers & row.layer) != 0});
    }
    return report;
  }

 private:
  [[nodiscard]] std::unique_ptr<Pool> makePool() const {
    return std::make_unique<Pool>(options_, processesFor(options_));
  }

  static void checkSize(const char* what, std::size_t size, std::size_t limit) {
    if (size <= limit) return;
    throw HostError(Reason::messageTooLarge, String(what) + " has " + std::to_string(size) +
                                                 " bytes, and " + std::to_string(limit) +
                                                 " are allowed");
  }

  /// The pool of this process. After a fork the inherited one belongs to the parent: its processes
  /// are no children of this one, and its locks may be held by threads that are not here. Several
  /// threads may find that out at a time; the first to have a new pool wins.
  Pool& ours() {
    Pool* pool = pool_.load();
    if (pool->isOurs()) return *pool;
    pool->abandon();
    std::unique_ptr<Pool> fresh = makePool();
    // Deliberate: the inherited pool is never freed.
    if (pool_.compare_exchange_strong(pool, fresh.get())) return *fresh.release();
    return *pool;
  }

  const Options options_;
  std::atomic<Pool*> pool_;
};

Client::Client() : Client(Options()) {}
Client::Client(Options options)
    : implementation_(std::make_unique<Implementation>(std::move(options))) {}
Client::~Client() = default;

template <OutputRecord R>
requires(!std::same_as<R, VespClientMessageResult>) R Client::unpack(Bytes message) {
  return implementation_->unpack<R>(message, {.command = 0, .service = {}});
}

template KEELGATE_API PulseUserPayload Client::unpack(Bytes);
template KEELGATE_API VespCommandResponse Client::unpack(Bytes);
template KEELGATE_API VespCommandWebTunnelResponse Client::unpack(Bytes);
template KEELGATE_API VespInvitation Client::unpack(Bytes);

VespClientMessageResult Client::unpackClientMessage(Bytes message,
                                                    const VespClientMessageContext& context) {
  return implementation_->unpack<VespClientMessageResult>(message, context);
}

ServiceReport Client::report() {
  return implementation_->report();
}

}  // namespace Keelgate
