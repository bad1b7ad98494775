// SPDX-License-Identifier: Apache-2.0
#include "framework/server/keelgate_server.h"

#include "framework/contracts/log.h"
#include "framework/transport/error_coding.h"

namespace Keelgate {

using Transport::ReplyKind;
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

Reply KeelgateServer::answer(const Request& request) const {
  LogCapture capture;
  Reply reply{.kind = ReplyKind::error, .body = {}, .log = {}};
  try {
    if (request.record >= handlers_.size() || !handlers_[request.record]) {
      throw Breach("com.tessen.Keelgate.KeelgateServer", "No unpacker for the record");
    }
    reply.body = handlers_[request.record](request);
    reply.kind = ReplyKind::record;
  } catch (const DecodingError& error) {
    reply.body = Transport::encodeError(error);
  } catch (const Breach& error) {
    reply.body = Transport::encodeError(error);
  } catch (const VespClientMessageUnpackingError& error) {
    reply.body = Transport::encodeError(error);
  }
  reply.log = std::move(capture.lines);
  return reply;
}

}  // namespace Keelgate
