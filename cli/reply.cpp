// SPDX-License-Identifier: Apache-2.0
/// From what the client gives or throws to the text that is printed. The names of kinds and reasons
/// are promised to scripts; the sentences are for people and may change.
#include "cli/reply.h"

#include "program/service/tables.h"

#include <keelgate/type_name.h>

#include <algorithm>

namespace Keelgate::CLI {

namespace {

using VespKeelgateService::MessageUnpackers;
using VespKeelgateService::VespClientMessageUnpackingError;

std::string_view nameOf(DecodingError::Kind kind) {
  switch (kind) {
    case DecodingError::Kind::keyNotFound:
      return "keyNotFound";
    case DecodingError::Kind::typeMismatch:
      return "typeMismatch";
    case DecodingError::Kind::valueNotFound:
      return "valueNotFound";
    case DecodingError::Kind::dataCorrupted:
      return "dataCorrupted";
  }
  return {};
}

std::string_view nameOf(HostError::Reason reason) {
  switch (reason) {
    case HostError::Reason::crashed:
      return "crashed";
    case HostError::Reason::timedOut:
      return "timedOut";
    case HostError::Reason::messageTooLarge:
      return "messageTooLarge";
    case HostError::Reason::resourcesExhausted:
      return "resourcesExhausted";
    case HostError::Reason::protocolViolation:
      return "protocolViolation";
    case HostError::Reason::startFailed:
      return "startFailed";
  }
  return {};
}

std::string_view nameOf(VespClientMessageUnpackingError::Case which) {
  switch (which) {
    case VespClientMessageUnpackingError::Case::unimplementedCommand:
      return "unimplementedCommand";
    case VespClientMessageUnpackingError::Case::noUnpackerForService:
      return "noUnpackerForService";
  }
  return {};
}

/// What the user can do about it, where there is something.
std::string_view advice(HostError::Reason reason) {
  switch (reason) {
    case HostError::Reason::timedOut:
      return "; --time-limit SECONDS gives it longer";
    case HostError::Reason::messageTooLarge:
      return "; --max-message BYTES sets the limit";
    default:
      return "";
  }
}

template <class Out>
void writePreface(Out& out, const Preface& preface) {
  if (preface.key.empty()) return;
  writeKey(out, preface.key);
  writeRaw(out, preface.value);
}

/// Keys as strings and positions as numbers: a dictionary with the key "1" is no array.
template <class Out>
void writeError(Out& out, const DecodingError& error) {
  writeField(out, "kind", String(nameOf(error.kind)));
  writeField(out, "key", error.key);
  writeKey(out, "codingPath");
  out.StartArray();
  for (const CodingKey& step : error.codingPath) {
    std::visit([&](const auto& keyOrIndex) { writeJson(out, keyOrIndex); }, step);
  }
  out.EndArray();
  writeField(out, "description", error.debugDescription);
}

template <class Out>
void writeError(Out& out, const Breach& error) {
  writeField(out, "kind", String("breach"));
  writeField(out, "domain", error.domain);
  writeField(out, "errorType", error.errorType);
  writeField(out, "keyPath", error.keyPath);
}

template <class Out>
void writeError(Out& out, const VespClientMessageUnpackingError& error) {
  writeField(out, "kind", String("unpacking"));
  writeField(out, "domain", String(VespClientMessageUnpackingError::domain));
  writeField(out, "code", Int{error.code()});
  writeField(out, "case", String(nameOf(error.which)));
  if (error.command) writeField(out, "command", error.command->rawValue());
  writeField(out, "service", error.service);
}

template <class Out>
void writeError(Out& out, const HostError& error) {
  writeField(out, "kind", String("host"));
  writeField(out, "reason", String(nameOf(error.reason)));
  writeField(out, "description", error.description);
}

/// Rejected is the mildest; a caller that knows worse says so afterwards.
template <class E>
Reply rejection(const E& error, const Preface& preface, Layout layout) {
  return {.json = jsonObject(layout,
                             [&](auto& out) {
                               writePreface(out, preface);
                               writeKey(out, "error");
                               out.StartObject();
                               writeError(out, error);
                               out.EndObject();
                             }),
          .verdict = Verdict::rejected,
          .problem = error.what()};
}

template <class R>
String recordObject(const R& record, const Preface& preface, Layout layout) {
  return jsonObject(layout, [&](auto& out) {
    writePreface(out, preface);
    writeField(out, "record", String(typeName<R>()));
    writeField(out, "value", record);
  });
}

String unpack(Client& client, const Subject& subject, Bytes message, const Preface& preface,
              Layout layout) {
  if (const auto* context = std::get_if<VespClientMessageContext>(&subject)) {
    return recordObject(client.unpackClientMessage(message, *context), preface, layout);
  }
  // The record that is asked for by name, which the caller has checked. Only here does a name
  // become a type: behind it everything is checked by the compiler.
  String json;
  MessageUnpackers::each([&]<class U>(std::type_identity<U>) {
    using R = typename U::SchemaType;
    if (typeName<R>() != std::get<String>(subject)) return;
    json = recordObject(client.unpack<R>(message), preface, layout);
  });
  return json;
}

}  // namespace

const Array<std::string_view>& recordNames() {
  // Made once, which the language keeps safe from any thread.
  static const Array<std::string_view> names = [] {
    Array<std::string_view> all;
    MessageUnpackers::each(
        [&]<class U>(std::type_identity<U>) { all.push_back(typeName<typename U::SchemaType>()); });
    return all;
  }();
  return names;
}

Bool isRecordName(std::string_view name) {
  return std::ranges::find(recordNames(), name) != recordNames().end();
}

Reply answer(Client& client, const Subject& subject, Bytes message, const Preface& preface,
             Layout layout) {
  try {
    return {.json = unpack(client, subject, message, preface, layout),
            .verdict = Verdict::record,
            .problem = {}};
  } catch (const DecodingError& error) {
    return rejection(error, preface, layout);
  } catch (const Breach& error) {
    return rejection(error, preface, layout);
  } catch (const VespClientMessageUnpackingError& error) {
    return rejection(error, preface, layout);
  } catch (const HostError& error) {
    return givenUp(error, preface, layout);
  }
}

Reply givenUp(const HostError& error, const Preface& preface, Layout layout) {
  Reply reply = rejection(error, preface, layout);
  reply.problem += advice(error.reason);
  // The one reason that is not about this message: the next would fare no better.
  if (error.reason == HostError::Reason::startFailed) reply.verdict = Verdict::serviceLost;
  return reply;
}

Reply requestError(std::string_view description, const Preface& preface) {
  return {.json = jsonObject(Layout::compact,
                             [&](auto& out) {
                               writePreface(out, preface);
                               writeKey(out, "error");
                               out.StartObject();
                               writeField(out, "kind", String("request"));
                               writeField(out, "description", String(description));
                               out.EndObject();
                             }),
          .verdict = Verdict::unusable,
          .problem = String(description)};
}

}  // namespace Keelgate::CLI
