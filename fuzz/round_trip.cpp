// SPDX-License-Identifier: Apache-2.0
#include "fuzz/round_trip.h"

#include "framework/json/values.h"
#include "framework/transport/error_coding.h"
#include "framework/transport/record_coding.h"
#include "fuzz/require.h"
#include "program/service/vesp_client_message_unpacker.h"

#include <rapidjson/error/error.h>
#include <rapidjson/reader.h>

#include <algorithm>
#include <string_view>

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
    fresh.registerUnpacker<VespClientMessageResult>(
        VespClientMessageUnpacker(ServiceToUnpackerMap(Services())));
    return fresh;
  }();
  return made;
}

void requireJSON(const std::string& text) {
  constexpr unsigned flags = rapidjson::kParseNumbersAsStringsFlag |
                             rapidjson::kParseIterativeFlag | rapidjson::kParseValidateEncodingFlag;
  rapidjson::Reader reader;
  rapidjson::BaseReaderHandler<> ignored;
  rapidjson::StringStream stream(text.c_str());
  require(!reader.Parse<flags>(stream, ignored).IsError(), "a record's JSON is JSON");
  require(text.find('\n') == text.size() - 1, "a record's JSON is one line");
}

template <class R>
std::string readRecord(Bytes body) {
  const auto record = Transport::decodeRecord<R>(body);
  require(std::ranges::equal(Transport::encodeRecord(record), body), "one spelling of a record");
  JSON::Writer out(JSON::Layout::compact);
  JSON::write(out, record);
  std::string text;
  for (const String& piece : std::move(out).take()) text += piece;
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
  return server().answer({.record = target.record,
                          .message = message,
                          .command = target.command,
                          .service = target.service});
}

std::string read(const Target& target, const Reply& reply) {
  if (reply.kind == Protocol::ReplyKind::error) return readError(reply.body);
  std::string text;
  OutputRecords::each([&]<class R>(std::type_identity<R>) {
    if (target.record == recordNumber<R>) text = readRecord<R>(reply.body);
  });
  return text;
}

}  // namespace Keelgate::Fuzz
