// SPDX-License-Identifier: Apache-2.0
/// One message handed to the service, and its outcome as the command prints it.
///
/// The functions may be called from many threads at once, on one client too.
#pragma once

#include "cli/json.h"

#include <keelgate/client.h>
#include <keelgate/records.h>

#include <string_view>
#include <variant>

namespace Keelgate::CLI {

/// What a message is to be unpacked as: the record that is asked for by name, or the context that a
/// client message arrived under.
using Subject = std::variant<String, VespClientMessageContext>;

/// The names that a Subject may have, in the order of registration.
const Array<std::string_view>& recordNames();
Bool isRecordName(std::string_view name);

/// The outcome of one message, from best to worst: an exit status follows from the worst one.
enum class Verdict { record, rejected, unusable, serviceLost };

struct Reply {
  /// The reply object with its newline; empty where a file could not even be read.
  String json;
  Verdict verdict = Verdict::record;
  /// What went wrong and what helps, as a sentence for people; empty with a record.
  String problem;
};

/// What comes first in a reply object: the request's id, or the file. Empty keys stand for none.
struct Preface {
  std::string_view key;
  /// JSON text.
  String value;
};

/// Unpacks `message`. Never throws what the service threw: that is the reply.
Reply answer(Client& client, const Subject& subject, Bytes message, const Preface& preface,
             Layout layout);

/// The reply to a message that was given up before it came to a client.
Reply givenUp(const HostError& error, const Preface& preface, Layout layout);

/// The reply to a line that is no valid request.
Reply requestError(std::string_view description, const Preface& preface);

}  // namespace Keelgate::CLI
