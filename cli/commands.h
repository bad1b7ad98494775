// SPDX-License-Identifier: Apache-2.0
/// The command line, and what the subcommands do once it is understood. Each says what it has to
/// say on the console and notes the exit status there; HostError (startFailed) is thrown through.
#pragma once

#include "cli/console.h"
#include "framework/json/reply.h"

#include <keelgate/client.h>

namespace Keelgate::CLI {

/// Understands the command line, and does what it asks for. `words` are without the command's own
/// name. Help is printed; wrong usage is said and noted.
void run(Array<String> words, std::string_view version, Console& console);

struct UnpackOptions {
  JSON::Subject subject;
  /// Paths; "-" is standard input.
  Array<String> files;
  /// The discarded one checks messages and prints nothing of them.
  JSON::Layout layout = JSON::Layout::compact;
  /// Of a property list, the form that loses nothing.
  Bool typed = false;
};

/// Unpacks every file, several at a time, and prints the replies in the order of the files. A file
/// that cannot be read has no reply and does not keep the others from theirs.
void unpack(const Client::Options& options, const UnpackOptions& what, Console& console);

/// Answers the requests on standard input until it ends. Replies are flushed as soon as no input
/// waits: whoever is at the other end of the pipe may wait for each before writing the next
/// request. `metrics` is the path of a file that is kept up to date with what was answered; empty:
/// none is.
void stream(const Client::Options& options, const String& metrics, Console& console);

enum class DescribeForm : std::uint8_t { page, json, jsonSchema };

/// Prints what this build knows, or what has the given name. An unknown name is said on the console
/// together with the nearest ones. Starts no service.
void describe(const Optional<String>& name, DescribeForm form, Console& console);

/// Prints the versions of the command and of its service, and the service's sandbox layers.
void reportVersions(std::string_view version, const Client::Options& options, Console& console);

}  // namespace Keelgate::CLI
