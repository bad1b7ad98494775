// SPDX-License-Identifier: Apache-2.0
#include "fuzz/messages/round_trip.h"

#include "cli/request_line.h"
#include "framework/json/values.h"
#include "framework/transport/error_coding.h"
#include "framework/transport/record_coding.h"
#include "fuzz/require.h"
#include "program/service/vesp_client_message_unpacker.h"

#include <algorithm>
#include <utility>
#include <variant>

namespace Keelgate::Fuzz {

namespace {

using VespKeelgateService::VespClientMessageUnpackingError;

const KeelgateServer& server() {
  static KeelgateServer& made = [&]() -> KeelgateServer& {
    using namespace VespKeelgateService;
    KeelgateServer& fresh = KeelgateServer::service();
    MessageUnpackers::each([&]<class U>(std::type_identity<U>) {
      fresh.registerUnpacker<typename U::SchemaType>(U());
    });
    fresh.registerUnpacker<VespClientMessageResult>(VespClientMessageUnpacker(Services()));
    return fresh;
  }();
  return made;
}

/// Another reader finds the same in it: the command's own, as the id of a request.
void requireJSON(const std::string& text) {
  std::string line = R"({"record":"PulseUserPayload","message":"","id":)" + text + "}";
  const CLI::RequestLine read = CLI::readRequestLine(line);
  require(std::holds_alternative<CLI::StreamRequest>(read.content), "a record's JSON is JSON");
  require(read.id == text, "a record's JSON is the one spelling of what it says");
}

template <class R>
std::string readRecord(Bytes body) {
  auto record = Transport::decodeRecord<R>(body);
  JSON::Writer out(JSON::Layout::compact);
  JSON::write(out, record);
  const Data again = Transport::lendRecord(record).joined();
  require(std::ranges::equal(again, body), "one spelling of a record");
  std::string text;
  for (const String& piece : std::move(out).take()) text += piece;
  require(text.ends_with('\n'), "a record's JSON is a line");
  text.pop_back();
  requireJSON(text);
  return text;
}

template <class E>
void requireSpelling(const E& error, Bytes body) {
  require(std::ranges::equal(Transport::encodeError(error), body), "one spelling of an error");
}

std::string readError(Bytes body) try {
  Transport::throwError(body);
} catch (const DecodingError& error) {
  requireSpelling(error, body);
  std::string text = "decoding " + std::to_string(static_cast<int>(error.kind));
  text += " " + error.key.value_or("");
  for (const CodingKey& step : error.codingPath) {
    const auto* index = std::get_if<std::size_t>(&step);
    text += index ? " " + std::to_string(*index) : " \"" + std::get<String>(step);
  }
  return text;
} catch (const Breach& error) {
  requireSpelling(error, body);
  return "breach " + error.domain + error.errorType + error.keyPath.value_or("");
} catch (const VespClientMessageUnpackingError& error) {
  requireSpelling(error, body);
  return "unpacking " + std::to_string(error.code());
}

}  // namespace

Reply replyTo(const Target& target, Bytes message) {
  Reply reply{};
  server().answer({.record = target.record,
                   .message = message,
                   .command = target.command,
                   .service = target.service},
                  [&](const Reply& given) {
                    reply = given;
                    reply.body = {.bytes = std::move(reply.body).joined(), .loans = {}};
                  });
  return reply;
}

std::string read(const Target& target, const Reply& reply) {
  if (reply.kind == Protocol::ReplyKind::error) return readError(reply.body.bytes);
  std::string text;
  OutputRecords::each([&]<class R>(std::type_identity<R>) {
    if (target.record == recordNumber<R>) text = readRecord<R>(reply.body.bytes);
  });
  return text;
}

}  // namespace Keelgate::Fuzz
