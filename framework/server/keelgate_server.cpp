// SPDX-License-Identifier: Apache-2.0
/// Registration and the one place where errors of a message are caught. Out here they are bytes.
#include "framework/server/keelgate_server.h"

#include "framework/contracts/log.h"
#include "framework/transport/error_coding.h"

namespace Keelgate {

using Protocol::ReplyKind;
using VespKeelgateService::VespClientMessageUnpackingError;

KeelgateServer& KeelgateServer::service() {
  static KeelgateServer shared;
  return shared;
}

void KeelgateServer::add(std::size_t record, Handler handler) {
  // Two unpackers for one record are a programming error: better no service than the wrong one.
  if (handlers_.at(record)) std::terminate();
  handlers_.at(record) = std::move(handler);
}

void KeelgateServer::answer(const ReceivedMessage& request, const Give& give) const {
  // Outside the try, so that what was logged before an error travels with it.
  LogCapture capture;
  const auto giveAs = [&](ReplyKind kind, Transport::Body body) {
    give({.kind = kind, .body = std::move(body), .log = std::move(capture.lines)});
  };
  const auto giveError = [&](const auto& error) {
    giveAs(ReplyKind::error, {.bytes = Transport::encodeError(error), .loans = {}});
  };
  try {
    if (request.record >= handlers_.size() || !handlers_[request.record]) {
      // The number comes from the client, of which another build may know more records.
      throw Breach("com.tessen.Keelgate.KeelgateServer", "No unpacker for the record");
    }
    handlers_[request.record](
        request, [&](Transport::Body body) { giveAs(ReplyKind::record, std::move(body)); });
  } catch (const DecodingError& error) {
    giveError(error);
  } catch (const Breach& error) {
    giveError(error);
  } catch (const VespClientMessageUnpackingError& error) {
    giveError(error);
  }
  // Anything else that is thrown is a defect of the program, or an end of memory: no reply hides
  // it.
}

}  // namespace Keelgate
