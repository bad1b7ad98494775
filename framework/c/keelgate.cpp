// SPDX-License-Identifier: Apache-2.0
/// The C interface: a client whose replies are text. Whatever is thrown ends here.
#include <keelgate.h>

#include "framework/json/reply.h"

#include <keelgate/client.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <new>
#include <string_view>

using Keelgate::Client;
using Keelgate::JSON::Reply;
using Keelgate::JSON::Status;
using Keelgate::JSON::Subject;

/// The time limit beside the client, which has no way to ask for it: JSON is made within it too.
struct keelgate_client {
  Client client;
  std::chrono::milliseconds timeLimit;
};

namespace {

/// What a program gets that fills nothing in.
keelgate_options defaults() {
  const Client::Options options;
  return {.size = sizeof(keelgate_options),
          .service_path = nullptr,
          .socket = nullptr,
          .processes = options.processes,
          .messages_per_process = options.messagesPerProcess,
          .max_message = options.largestMessage,
          .time_limit_ms = static_cast<unsigned>(options.timeLimit.count()),
          .require_layers = options.requireLayers ? 1 : 0};
}

/// With malloc, as keelgate_free expects it; null where there is no memory.
template <class Texts>
char* copyOf(const Texts& texts) noexcept {
  std::size_t size = 0;
  for (const std::string_view text : texts) size += text.size();
  char* const copy = static_cast<char*>(std::malloc(size + 1));
  if (copy == nullptr) return nullptr;
  char* end = copy;
  for (const std::string_view text : texts) end = std::copy(text.begin(), text.end(), end);
  *end = '\0';
  return copy;
}

void tell(char** error, std::string_view sentence) noexcept {
  if (error != nullptr) *error = copyOf(std::array{sentence});
}

Client::Options optionsFrom(const keelgate_options& options) {
  Client::Options made;
  made.processes = options.processes;
  made.timeLimit = std::chrono::milliseconds(options.time_limit_ms);
  made.largestMessage = options.max_message;
  made.messagesPerProcess = options.messages_per_process;
  made.requireLayers = options.require_layers != 0;
  if (options.service_path != nullptr) made.servicePath = options.service_path;
  if (options.socket != nullptr) made.socket = options.socket;
  return made;
}

/// A reply that needs no memory but its own, for when there is next to none.
constexpr std::string_view noMemory =
    R"({"error":{"kind":"host","reason":"resourcesExhausted",)"
    R"("description":"there is not enough memory for the reply"}})";

/// The pieces of a reply without the newline, which is for streams.
char* textOf(Keelgate::JSON::Pieces& pieces) noexcept {
  if (!pieces.empty() && pieces.back().ends_with('\n')) pieces.back().pop_back();
  return copyOf(pieces);
}

int statusOf(const Reply& reply) {
  if (reply.status == Status::done) return KEELGATE_RECORD;
  return reply.reason ? KEELGATE_GIVEN_UP : KEELGATE_REJECTED;
}

/// What the functions that unpack have in common; `subject` makes a Subject, or throws, and is not
/// asked where there is none.
template <class MakeSubject>
int unpack(keelgate_client* client, const void* message, std::size_t length, char** reply,
           bool hasSubject, const MakeSubject& subject, bool typed = false) noexcept {
  if (reply == nullptr) return KEELGATE_WRONG_USE;
  *reply = nullptr;
  if (!hasSubject || client == nullptr || (message == nullptr && length > 0)) {
    return KEELGATE_WRONG_USE;
  }
  int status = KEELGATE_GIVEN_UP;
  try {
    Reply answer =
        Keelgate::JSON::answer(client->client, client->timeLimit, subject(),
                               {static_cast<const std::byte*>(message), length}, {.typed = typed});
    *reply = textOf(answer.json);
    if (*reply != nullptr) status = statusOf(answer);
  } catch (const std::exception&) {
    // Nothing but an allocation fails here, and what it was for is gone again.
  }
  if (*reply == nullptr) *reply = copyOf(std::array{noMemory});
  return status;
}

}  // namespace

void keelgate_options_init(keelgate_options* options, size_t size) {
  if (options == nullptr || size < sizeof options->size) return;
  keelgate_options values = defaults();
  values.size = size;
  std::memset(options, 0, size);
  std::memcpy(options, &values, std::min(size, sizeof values));
}

keelgate_client* keelgate_open(const keelgate_options* options, char** error) {
  if (error != nullptr) *error = nullptr;
  if (options != nullptr &&
      (options->size < sizeof options->size || options->size > sizeof(keelgate_options))) {
    tell(error,
         "The options have a size that this library does not know: fill them in with "
         "keelgate_options_init, and use a library that is not older than the header");
    return nullptr;
  }
  try {
    // As the caller knows them, and the defaults for the rest.
    keelgate_options all = defaults();
    if (options != nullptr) std::memcpy(&all, options, options->size);
    return new keelgate_client{.client = Client(optionsFrom(all)),
                               .timeLimit = std::chrono::milliseconds(all.time_limit_ms)};
  } catch (const Keelgate::HostError& failure) {
    tell(error, failure.description);
  } catch (const std::bad_alloc&) {
    tell(error, "There is not enough memory for a client");
  } catch (const std::exception& failure) {
    tell(error, failure.what());
  }
  return nullptr;
}

int keelgate_unpack(keelgate_client* client, const char* record, const void* message, size_t length,
                    char** reply) {
  const bool isRecord = record != nullptr && Keelgate::JSON::isRecordName(record);
  return unpack(client, message, length, reply, isRecord,
                [&] { return Subject(Keelgate::String(record)); });
}

int keelgate_unpack_typed(keelgate_client* client, const void* message, size_t length,
                          char** reply) {
  return unpack(
      client, message, length, reply, true,
      [] { return Subject(Keelgate::String(Keelgate::JSON::propertyList)); }, true);
}

int keelgate_unpack_client_message(keelgate_client* client, const char* service, uint64_t command,
                                   const void* message, size_t length, char** reply) {
  return unpack(client, message, length, reply, service != nullptr, [&] {
    return Subject(Keelgate::VespClientMessageContext{.command = command, .service = service});
  });
}

void keelgate_free(char* text) {
  std::free(text);
}

void keelgate_close(keelgate_client* client) {
  delete client;
}

const char* keelgate_version(void) {
  return KEELGATE_VERSION;
}
