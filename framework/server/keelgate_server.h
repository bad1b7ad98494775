// SPDX-License-Identifier: Apache-2.0
/// The server that owns a service process once it has been resumed.
///
/// Registration happens on the main thread, before `resume`, and never changes afterwards. `answer`
/// only reads what was registered: it may be called from any thread.
#pragma once

#include "framework/contracts/unpacker.h"
#include "framework/protocol/frames.h"
#include "framework/transport/record_coding.h"

#include <array>
#include <functional>
#include <string_view>

namespace Keelgate {

/// The sandboxes that a service can be resumed in.
enum class SandboxID { keelgate };

/// One message, as it arrived. Everything is borrowed for the time of the call.
struct ReceivedMessage {
  /// recordNumber<Record> of the record that is asked for.
  std::size_t record;
  Bytes message;
  UInt64 command;
  std::string_view service;
};

/// The one answer to a request: the body of a record frame or of an error frame, and what was
/// logged on the way. Its body may borrow from the record.
struct Reply {
  Protocol::ReplyKind kind;
  Transport::Body body;
  Array<String> log;
};

/// It knows records and no formats: what a message is, is the unpackers' business.
class KeelgateServer {
 public:
  /// The shared server of this process. Made at its first use.
  static KeelgateServer& service();

  /// Registers the unpacker for the record that it gives, which no other may be registered for.
  template <OutputRecord R, MessageUnpacker U>
  requires std::same_as<typename U::SchemaType, R>
  void registerUnpacker(U unpacker) {
    add<R>([unpacker = std::move(unpacker)](const ReceivedMessage& request) {
      return unpacker.unpack(request.message);
    });
  }
  template <OutputRecord R, ContextualUnpacker U>
  requires std::same_as<typename U::SchemaType, R>
  void registerUnpacker(U unpacker) {
    add<R>([unpacker = std::move(unpacker)](const ReceivedMessage& request) {
      return unpacker.unpack(
          request.message,
          typename U::Context{.command = request.command, .service = String(request.service)});
    });
  }

  /// Serves under this identifier until the channel closes. Without one there is no sandbox to
  /// serve in, and it returns at once. With one it does not return: the process exits in it.
  void resume(Optional<SandboxID> sandboxID);

  using Give = std::function<void(const Reply&)>;

  /// Unpacks one message, and calls `give` once with its reply, which lives as long as the call.
  /// Errors of the message are in the reply; std::bad_alloc comes through. A request for a record
  /// that nobody is registered for gives a Breach.
  ///
  /// What `give` throws must not be an error of a message. It need not return: a caller that
  /// expects no further message exits in it and never destroys the record, which would take a
  /// seventh of the time that it took to make.
  void answer(const ReceivedMessage& request, const Give& give) const;

 private:
  using GiveBody = std::function<void(Transport::Body)>;
  using Handler = std::function<void(const ReceivedMessage&, const GiveBody&)>;

  template <OutputRecord R, class Unpack>
  void add(Unpack unpack) {
    add(recordNumber<R>,
        [unpack = std::move(unpack)](const ReceivedMessage& request, const GiveBody& give) {
          const R record = unpack(request);
          give(Transport::lendRecord(record));
        });
  }
  void add(std::size_t record, Handler handler);

  /// By the number of the record; empty where nobody is registered.
  std::array<Handler, OutputRecords::size> handlers_;
};

}  // namespace Keelgate
