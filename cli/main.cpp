// SPDX-License-Identifier: Apache-2.0
// The command line of keelgate. The only file that includes its parser, which is heavy.
#include "cli/commands.h"
#include "cli/request_line.h"
#include "text/utf8.h"

#include <keelgate/client.h>

#include <fmt/format.h>
#include <unistd.h>
#include <CLI/CLI.hpp>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <exception>
#include <limits>
#include <type_traits>

namespace Keelgate::CLI {

namespace {

constexpr std::string_view version = KEELGATE_VERSION;

/// What the command line says.
struct Arguments {
  Bool version = false;
  Bool verbose = false;
  /// Of whichever subcommand was chosen; the others leave it alone.
  Client::Options host;
  String record;
  String service;
  UInt64 command = 0;
  Array<String> files;
  Bool pretty = false;
  Bool compact = false;
  String name;
  Bool json = false;
};

// The parser reads numbers as C does, with octal and hexadecimal ones and signs that wrap round;
// an option here is a decimal number in its range or wrong usage.

template <class N>
::CLI::Option* addNumber(::CLI::App& app, const std::string& names, N& to, UInt64 least,
                         UInt64 most, const std::string& help) {
  const auto read = [&to, least, most](const std::string& text) {
    const Optional<UInt64> number = decimal(text);
    if (!number || *number < least || *number > most) {
      throw ::CLI::ValidationError(
          fmt::format("{} is no whole number from {} to {}", JSON::quote(text), least, most));
    }
    to = static_cast<N>(*number);
  };
  return app.add_option_function<std::string>(names, read, help)->type_name("N");
}

/// Rounded up to milliseconds, so that a limit is never none.
void addSeconds(::CLI::App& app, const std::string& names, std::chrono::milliseconds& to,
                const std::string& help) {
  const auto read = [&to](const std::string& text) {
    // Some thirty years. In milliseconds it is far from the end of 64 bits.
    constexpr double longest = 1e9;
    // strtod knows signs, exponents, hexadecimal and "inf" too; a limit is none of these.
    const Bool plain = text.find_first_not_of("0123456789.") == std::string::npos;
    char* end = nullptr;
    const double seconds = std::strtod(text.c_str(), &end);
    if (!plain || text.empty() || *end != '\0' || !(seconds > 0) || seconds > longest) {
      throw ::CLI::ValidationError(
          fmt::format("{} is no number of seconds above 0", JSON::quote(text)));
    }
    to = std::chrono::milliseconds(static_cast<Int>(std::ceil(seconds * 1000)));
  };
  app.add_option_function<std::string>(names, read, help)->type_name("SECONDS");
}

void addServiceOptions(::CLI::App& app, Client::Options& options) {
  auto* path = app.add_option("--service-path", options.servicePath, "The service to start")
                   ->type_name("FILE");
  app.add_option("--connect", options.socket, "The activated service to use instead")
      ->type_name("SOCKET")
      ->excludes(path);
}

void addHostOptions(::CLI::App& app, Client::Options& options) {
  // The client would cut them to these; here somebody typed them, and is told.
  constexpr UInt64 mostProcesses = 128;
  constexpr UInt64 largestMessage = std::numeric_limits<std::uint32_t>::max();
  addNumber(app, "--processes", options.processes, 1, mostProcesses,
            "Messages at once (default: as processors)");
  addNumber(app, "--messages-per-process", options.messagesPerProcess, 1,
            std::numeric_limits<std::uint32_t>::max(), "How many one process may see (default 1)");
  addSeconds(app, "--time-limit", options.timeLimit,
             "What a message may take, e.g. 0.5 (default 5)");
  addNumber(app, "--max-message", options.largestMessage, 1, largestMessage,
            "The largest message in bytes (default 67108864)")
      ->type_name("BYTES");
  app.add_flag("--require-layers", options.requireLayers,
               "Refuse to run without namespaces, Landlock");
  addServiceOptions(app, options);
}

void addUnpack(::CLI::App& app, Arguments& arguments) {
  auto& unpack = *app.add_subcommand("unpack", "Unpack messages, one from each file");
  auto* record = unpack.add_option("--record", arguments.record, "What the messages are")
                     ->type_name("TYPE")
                     ->check([](const std::string& name) {
                       return JSON::isRecordName(name)
                                  ? std::string()
                                  : fmt::format("{} is none of {}", JSON::quote(name),
                                                fmt::join(JSON::recordNames(), ", "));
                     });
  auto* service =
      unpack.add_option("--service", arguments.service, "The service that they arrived under")
          ->type_name("ID")
          ->excludes(record);
  auto* command = addNumber(unpack, "--command", arguments.command, 0,
                            std::numeric_limits<UInt64>::max(), "The command they arrived with")
                      ->excludes(record)
                      ->needs(service);
  // A service's name goes back in the error: bytes that are no text could not.
  service->needs(command)->check([](const std::string& id) {
    return Text::isUtf8(id) ? std::string() : "the identifier is not UTF-8";
  });
  auto* pretty = unpack.add_flag("--pretty", arguments.pretty, "Indent, as on a terminal");
  unpack.add_flag("--compact", arguments.compact, "One line for each, as in a pipe")
      ->excludes(pretty);
  unpack.add_option("FILE", arguments.files, "A message each; -, or none: standard input")
      ->type_name("");
  addHostOptions(unpack, arguments.host);
  unpack.footer(fmt::format(
      "TYPE is one of\n  {}\n"
      "\n"
      "Examples:\n"
      "  keelgate unpack --record VespInvitation invitation.plist\n"
      "  keelgate unpack --service com.tessen.private.braid.viso.video --command 232 <message\n"
      "\n"
      "Exit status: 0 all gave a record, 1 some were rejected, 2 wrong usage or an\n"
      "unreadable file, 3 no service. The largest that applies counts.",
      fmt::join(JSON::recordNames(), "\n  ")));
}

void addStream(::CLI::App& app, Arguments& arguments) {
  auto& stream = *app.add_subcommand("stream", "Answer requests, one JSON object on each line");
  addHostOptions(stream, arguments.host);
  stream.footer(
      "A request:\n"
      "  {\"record\": TYPE, \"message\": BASE64, \"id\": ANY}\n"
      "  {\"service\": ID, \"command\": N, \"message\": BASE64, \"id\": ANY}\n"
      "\n"
      "Example:\n"
      "  echo '{\"record\":\"VespCommandResponse\",\"message\":\"'$(base64 -w0 FILE)'\"}' |\n"
      "    keelgate stream\n"
      "\n"
      "Exit status: 0, 2 when some line was no valid request, 3 no service.");
}

void addDescribe(::CLI::App& app, Arguments& arguments) {
  auto& describe = *app.add_subcommand("describe", "Show what this build knows");
  describe.add_option("NAME", arguments.name, "A record type, service, schema, enumeration")
      ->type_name("");
  describe.add_flag("--json", arguments.json, "One JSON object");
  describe.footer(
      "Examples:\n"
      "  keelgate describe VespSessionInvitation\n"
      "  keelgate describe --json | jq '.services[].service'");
}

/// What the parser cannot be told.
void checkUsage(const ::CLI::App& app, const Arguments& arguments) {
  if (app.got_subcommand("unpack")) {
    const ::CLI::App& unpack = *app.get_subcommand("unpack");
    if (unpack.count("--record") + unpack.count("--service") == 0) {
      throw ::CLI::RequiredError("--record, or --service with --command,");
    }
    if (std::ranges::count(arguments.files, "-") > 1) {
      throw ::CLI::ValidationError("standard input can be read only once");
    }
  } else if (app.get_subcommands().empty() && !arguments.version) {
    throw ::CLI::RequiredError("A subcommand");
  }
}

/// Deliberate: the layout follows standard output alone, wherever the input comes from.
UnpackOptions unpackOptions(const ::CLI::App& unpack, const Arguments& arguments) {
  UnpackOptions options{
      .subject = arguments.record,
      .files = arguments.files,
      .layout = isTerminal(STDOUT_FILENO) ? JSON::Layout::pretty : JSON::Layout::compact};
  if (unpack.count("--service") > 0) {
    options.subject =
        VespClientMessageContext{.command = arguments.command, .service = arguments.service};
  }
  // As filters do: a pipe needs no file to be named.
  if (options.files.empty()) options.files.emplace_back("-");
  if (arguments.pretty) options.layout = JSON::Layout::pretty;
  if (arguments.compact) options.layout = JSON::Layout::compact;
  return options;
}

void run(const ::CLI::App& app, Arguments& arguments, Console& console) {
  if (app.got_subcommand("unpack")) {
    unpack(arguments.host, unpackOptions(*app.get_subcommand("unpack"), arguments), console);
  } else if (app.got_subcommand("stream")) {
    stream(arguments.host, console);
  } else if (app.got_subcommand("describe")) {
    // Asked for by count: an empty name is a name too, and nothing has it.
    const Bool named = app.get_subcommand("describe")->count("NAME") > 0;
    describe(named ? Optional<String>(arguments.name) : std::nullopt, arguments.json, console);
  } else if (arguments.verbose) {
    reportVersions(version, arguments.host, console);
  } else {
    console.print(fmt::format("keelgate {}\n", version));
  }
}

void build(::CLI::App& app, Arguments& arguments) {
  // None is right with --version alone, which is for checkUsage to see.
  app.require_subcommand(0, 1);
  app.add_flag("--version", arguments.version, "Show the version");
  app.add_flag("--verbose", arguments.verbose, "The service's version and sandbox layers too")
      ->needs("--version");
  addServiceOptions(app, arguments.host);
  addUnpack(app, arguments);
  addStream(app, arguments);
  addDescribe(app, arguments);
  app.footer("See `keelgate SUBCOMMAND --help` for each, with examples.");
}

/// As the parser wants them. It loses the empty value of `--service=`, which is legal here and the
/// same as an empty word of its own.
Array<String> reversed(Array<String> words) {
  const auto end = std::ranges::find(words, "--");
  for (auto word = end; word != words.begin();) {
    --word;
    if (!word->starts_with("--") || !word->ends_with('=')) continue;
    word->pop_back();
    word = words.insert(word + 1, String()) - 1;
  }
  std::ranges::reverse(words);
  return words;
}

/// Help is a result; anything else that the parser throws is wrong usage.
void parse(::CLI::App& app, const Arguments& arguments, Array<String> words, Console& console) {
  try {
    app.parse(reversed(std::move(words)));
    checkUsage(app, arguments);
  } catch (const ::CLI::Success&) {
    throw;
  } catch (const ::CLI::ParseError& error) {
    const auto chosen = app.get_subcommands();
    const String subcommand = chosen.empty() ? "" : chosen.front()->get_name() + " ";
    console.complain(error.what());
    // Of the subcommand that was meant, so that the help is the one that is wanted.
    console.complain(fmt::format("see `keelgate {}--help`", subcommand));
    console.note(Status::unusable);
    throw;
  }
}

void keelgate(Array<String> words, Console& console) {
  ::CLI::App app("Unpacks untrusted messages in a sandbox and prints their records.", "keelgate");
  Arguments arguments;
  build(app, arguments);
  try {
    parse(app, arguments, std::move(words), console);
    run(app, arguments, console);
  } catch (const ::CLI::Success&) {
    const auto chosen = app.get_subcommands();
    console.print(chosen.empty() ? app.help() : chosen.front()->help("keelgate"));
  } catch (const ::CLI::ParseError&) {
    // Said already.
  } catch (const std::exception& error) {
    console.complain(error.what());
    // As a rule a HostError from the start of the service; whatever it was, no more is unpacked.
    console.note(Status::serviceLost);
  }
}

}  // namespace

}  // namespace Keelgate::CLI

int main(int count, char** words) {
  Keelgate::CLI::Console console;
  Keelgate::CLI::keelgate({words + 1, words + count}, console);
  console.flush();
  return static_cast<int>(console.status());
}
