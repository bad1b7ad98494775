// SPDX-License-Identifier: Apache-2.0
/// From what the client gives or throws to the text that is printed. The names of kinds and reasons
/// are promised to scripts; the sentences are for people and may change.
#include "framework/json/reply.h"

#include "framework/json/values.h"

#include <algorithm>
#include <new>
#include <type_traits>

namespace Keelgate::JSON {

namespace {

using VespKeelgateService::VespClientMessageUnpackingError;

/// What a record may have of JSON: some room for any message, and what the worst honest spelling
/// makes of a byte, several times over.
constexpr std::size_t anyMessage = std::size_t{16} << 20;
constexpr std::size_t perByte = 64;

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

/// Keys as strings and positions as numbers: a dictionary with the key "1" is not an array.
void writeError(Writer& out, const DecodingError& error) {
  writeField(out, "kind", nameOf(error.kind));
  writeField(out, "key", error.key);
  out.key("codingPath");
  out.beginArray();
  for (const CodingKey& step : error.codingPath) {
    std::visit([&](const auto& keyOrIndex) { write(out, keyOrIndex); }, step);
  }
  out.endArray();
  writeField(out, "description", error.debugDescription);
}

void writeError(Writer& out, const Breach& error) {
  writeField(out, "kind", "breach");
  writeField(out, "domain", error.domain);
  writeField(out, "errorType", error.errorType);
  writeField(out, "keyPath", error.keyPath);
}

void writeError(Writer& out, const VespClientMessageUnpackingError& error) {
  writeField(out, "kind", "unpacking");
  writeField(out, "domain", VespClientMessageUnpackingError::domain);
  writeField(out, "code", Int{error.code()});
  writeField(out, "case", nameOf(error.which));
  if (error.command) writeField(out, "command", error.command->rawValue());
  writeField(out, "service", error.service);
}

void writeError(Writer& out, const HostError& error) {
  writeField(out, "kind", "host");
  writeField(out, "reason", nameOf(error.reason));
  writeField(out, "description", error.description);
}

/// The whole object, around what `members` writes.
template <class Members>
Pieces object(const Form& form, Budget budget, const Members& members) {
  Writer out(form.layout, budget);
  out.beginObject();
  if (!form.prefaceKey.empty()) {
    out.key(form.prefaceKey);
    out.raw(form.preface);
  }
  members(out);
  out.endObject();
  return std::move(out).take();
}

/// The reply {"error": …} around what `members` writes. Errors are as long as the message's keys
/// and no longer, and have no budget: an answer there must be.
template <class Members>
Pieces errorObject(const Form& form, const Members& members) {
  return object(form, {}, [&](Writer& out) {
    out.key("error");
    out.beginObject();
    members(out);
    out.endObject();
  });
}

template <class E>
Reply rejection(const E& error, const Form& form) {
  return {.json = errorObject(form, [&](Writer& out) { writeError(out, error); }),
          .status = Status::rejected,
          .problem = error.what()};
}

template <class R>
Pieces recordObject(const R& record, Budget budget, const Form& form) {
  return object(form, budget, [&](Writer& out) {
    writeField(out, "record", typeName<R>());
    if constexpr (std::is_same_v<R, PropertyList>) {
      if (form.typed) {
        out.key("value");
        return writeTyped(out, record.value);
      }
    }
    writeField(out, "value", record);
  });
}

Pieces unpacked(Client& client, const Subject& subject, Bytes message, Budget budget,
                const Form& form) {
  if (const auto* context = std::get_if<VespClientMessageContext>(&subject)) {
    return recordObject(client.unpackClientMessage(message, *context), budget, form);
  }
  Pieces json;
  // Only here does a name become a type: behind it everything is checked by the compiler.
  OutputRecords::each([&]<class R>(std::type_identity<R>) {
    if constexpr (!std::is_same_v<R, VespClientMessageResult>) {
      if (typeName<R>() != std::get<String>(subject)) return;
      json = recordObject(client.unpack<R>(message), budget, form);
    }
  });
  return json;
}

}  // namespace

const Array<std::string_view>& recordNames() {
  // Made once, which the language keeps safe from any thread.
  static const Array<std::string_view> names = [] {
    Array<std::string_view> all;
    OutputRecords::each([&]<class R>(std::type_identity<R>) {
      // It comes with a context, and is not asked for by name.
      if (!std::is_same_v<R, VespClientMessageResult>) all.push_back(typeName<R>());
    });
    return all;
  }();
  return names;
}

Bool isRecordName(std::string_view name) {
  return std::ranges::find(recordNames(), name) != recordNames().end();
}

Reply answer(Client& client, std::chrono::milliseconds timeLimit, const Subject& subject,
             Bytes message, const Form& form) {
  const Budget budget{.bytes = anyMessage + perByte * message.size() + form.preface.size(),
                      .deadline = std::chrono::steady_clock::now() + timeLimit};
  try {
    return {.json = unpacked(client, subject, message, budget, form)};
  } catch (const DecodingError& error) {
    return rejection(error, form);
  } catch (const Breach& error) {
    return rejection(error, form);
  } catch (const VespClientMessageUnpackingError& error) {
    return rejection(error, form);
  } catch (const HostError& error) {
    return givenUp(error, form);
  } catch (const std::bad_alloc&) {
    // The record and its text are gone by now, and their memory is free for this.
    return givenUp(HostError(HostError::Reason::resourcesExhausted,
                             "there is not enough memory for the record"),
                   form);
  }
}

Reply givenUp(const HostError& error, const Form& form) {
  Reply reply = rejection(error, form);
  reply.reason = error.reason;
  reply.problem += advice(error.reason);
  if (error.reason == HostError::Reason::startFailed) reply.status = Status::serviceLost;
  return reply;
}

Reply requestError(std::string_view description, const Form& form) {
  const auto members = [&](Writer& out) {
    writeField(out, "kind", "request");
    writeField(out, "description", description);
  };
  return {.json = errorObject(form, members),
          .status = Status::unusable,
          .problem = String(description)};
}

}  // namespace Keelgate::JSON
