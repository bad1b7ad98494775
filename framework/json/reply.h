// SPDX-License-Identifier: Apache-2.0
/// One message handed to a client, and its outcome as a reply object:
///
///     {"record": TYPE, "value": RECORD}    or    {"error": ERROR}
///
/// The functions may be called from many threads at once, on one client too.
#pragma once

#include "framework/json/writer.h"

#include <keelgate/client.h>
#include <keelgate/errors.h>
#include <keelgate/records.h>
#include <keelgate/type_name.h>

#include <chrono>
#include <string_view>
#include <variant>

namespace Keelgate::JSON {

/// What a message is to be unpacked as: the record that is asked for by name, or the context that a
/// client message arrived under.
using Subject = std::variant<String, VespClientMessageContext>;

/// The record that any property list is, and that has a typed form.
constexpr std::string_view propertyList = typeName<PropertyList>();

/// The names that a Subject may have, in the order of the output records.
const Array<std::string_view>& recordNames();
Bool isRecordName(std::string_view name);

/// What became of a message, from best to worst. The worst of a run is the command's exit status:
/// scripts go by the numbers.
enum class Status : std::uint8_t {
  /// There is a record.
  done = 0,
  /// By the unpacker, or by the host: `Reply::reason` tells which.
  rejected = 1,
  /// There is no message: wrong usage, an invalid request, a file that cannot be read. Or the reply
  /// could not be written.
  unusable = 2,
  /// There is no service, and the next message would fare no better.
  serviceLost = 3,
};

struct Reply {
  /// The reply object with its newline; empty where there is none.
  Pieces json = {};
  Status status = Status::done;
  /// Where the host gave the message up.
  Optional<HostError::Reason> reason = {};
  /// What went wrong and what helps, as a sentence for people; empty with a record.
  String problem = {};
};

/// How a reply object is made.
struct Form {
  Layout layout = Layout::compact;
  /// What comes first: the request's id or the file, with its value as JSON text. An empty key
  /// stands for nothing.
  std::string_view prefaceKey = {};
  String preface = {};
  /// Of a PropertyList, the form that loses nothing.
  Bool typed = false;
};

/// Unpacks `message`, whose record has to be there, as JSON too, by the time limit. Never throws
/// what the service threw: that is the reply. A record that has too much JSON for its message, or
/// more than there is memory for, becomes the reply `resourcesExhausted`.
Reply answer(Client& client, std::chrono::milliseconds timeLimit, const Subject& subject,
             Bytes message, const Form& form);

/// The reply to a message that was given up before it came to a client.
Reply givenUp(const HostError& error, const Form& form);

/// The reply to a line that is not a valid request.
Reply requestError(std::string_view description, const Form& form);

}  // namespace Keelgate::JSON
