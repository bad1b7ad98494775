// SPDX-License-Identifier: Apache-2.0
/// The only file that includes the parser of the command line, which is heavy.
#include "cli/commands.h"
#include "cli/files.h"
#include "cli/nearest.h"
#include "cli/request_line.h"
#include "cli/table.h"
#include "text/utf8.h"

#include <fmt/format.h>
#include <CLI/CLI.hpp>

#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <limits>
#include <system_error>

namespace Keelgate::CLI {

namespace {

/// What the options say, before they are put together.
struct Arguments {
  Client::Options host;
  UnpackOptions unpack;
  String metrics;
  LogLevel logLevel = LogLevel::warning;
  Bool quiet = false;
  Bool version = false;
  Bool verbose = false;
  String record;
  String service;
  UInt64 command = 0;
  String filesFrom;
  Bool pretty = false;
  Bool compact = false;
  Bool json = false;
  Bool jsonSchema = false;
  String name;
};

// The parser reads numbers as C does, with octal and hexadecimal ones and signs that wrap round;
// an option here is a decimal number in its range or wrong usage.

[[noreturn]] void refuse(const std::string& option, const std::string& text,
                         const std::string& wanted) {
  throw ::CLI::ValidationError(fmt::format("{}: {} is not {}", option, JSON::quote(text), wanted));
}

/// A number, with a power of 1024 behind it where `units` are allowed.
Optional<UInt64> size(std::string_view text, Bool units) {
  constexpr std::string_view powers = "KMG";
  const std::size_t power =
      units && !text.empty()
          ? powers.find(static_cast<char>(std::toupper(static_cast<unsigned char>(text.back()))))
          : std::string_view::npos;
  if (power == std::string_view::npos) return decimal(text);
  const Optional<UInt64> number = decimal(text.substr(0, text.size() - 1));
  const unsigned shift = 10 * (static_cast<unsigned>(power) + 1);
  if (!number || *number > std::numeric_limits<UInt64>::max() >> shift) return std::nullopt;
  return *number << shift;
}

template <class N>
::CLI::Option* addNumber(::CLI::App& app, const std::string& name, N& to, UInt64 least, UInt64 most,
                         const std::string& help, Bool units = false) {
  const auto read = [&to, least, most, units, name](const std::string& text) {
    const Optional<UInt64> number = size(text, units);
    if (!number || *number < least || *number > most) {
      refuse(name, text, fmt::format("a whole number from {} to {}", least, most));
    }
    to = static_cast<N>(*number);
  };
  return app.add_option_function<std::string>(name, read, help)->type_name(units ? "BYTES" : "N");
}

/// Rounded up to milliseconds, so that a limit is never none.
void addSeconds(::CLI::App& app, const std::string& name, std::chrono::milliseconds& to,
                const std::string& help) {
  const auto read = [&to, name](const std::string& text) {
    // Some thirty years. In milliseconds it is far from the end of 64 bits.
    constexpr double longest = 1e9;
    // strtod knows signs, exponents, hexadecimal and "inf" too; a limit is none of these.
    const Bool plain = text.find_first_not_of("0123456789.") == std::string::npos;
    char* end = nullptr;
    const double seconds = std::strtod(text.c_str(), &end);
    if (!plain || *end != '\0' || !(seconds > 0) || seconds > longest) {
      refuse(name, text, "a number of seconds above 0");
    }
    to = std::chrono::milliseconds(static_cast<Int>(std::ceil(seconds * 1000)));
  };
  app.add_option_function<std::string>(name, read, help)->type_name("SECONDS");
}

template <class Choice>
void addChoice(::CLI::App& app, const std::string& name, const Array<String>& words, Choice& to,
               Choice first, const std::string& help) {
  const auto read = [name, words, first, &to](const std::string& word) {
    const auto found = std::ranges::find(words, word);
    if (found == words.end()) refuse(name, word, fmt::format("one of {}", fmt::join(words, ", ")));
    to = static_cast<Choice>(found - words.begin() + static_cast<Int>(first));
  };
  app.add_option_function<std::string>(name, read, help)->type_name("WORD");
}

void addServiceOptions(::CLI::App& app, Client::Options& options) {
  auto* path = app.add_option("--service-path", options.servicePath, "The service to start")
                   ->type_name("FILE");
  app.add_option("--connect", options.socket, "The activated service to use instead")
      ->type_name("SOCKET")
      ->excludes(path);
}

void addHostOptions(::CLI::App& app, Arguments& line) {
  // The client would cut them to these; here somebody typed them, and is told.
  const Client::Options defaults;
  constexpr UInt64 most = std::numeric_limits<std::uint32_t>::max();
  addNumber(app, "--processes", line.host.processes, 1, Client::Options::maximumProcesses,
            "How many messages at a time (default: one per processor)");
  addNumber(app, "--messages-per-process", line.host.messagesPerProcess, 1, most,
            fmt::format("How many each process may see (default {})", defaults.messagesPerProcess));
  addSeconds(app, "--time-limit", line.host.timeLimit,
             fmt::format("How long a message may take, e.g. 0.5 (default {})",
                         std::chrono::duration<double>(defaults.timeLimit).count()));
  // 4G itself is a byte too many, and what somebody types who wants the most: the client cuts it.
  addNumber(app, "--max-message", line.host.largestMessage, 1, UInt64{4} << 30,
            fmt::format("The largest message, e.g. 4K, 2M, 1G (default {}M)",
                        defaults.largestMessage >> 20),
            true);
  app.add_flag("--require-layers", line.host.requireLayers,
               "Refuse to run without namespaces or Landlock");
  addChoice(app, "--isolation", {"rewind", "fork"}, line.host.isolation, Client::Isolation::rewind,
            "How messages get fresh processes: rewind (default) or fork");
  app.add_flag("--quiet", line.quiet, "Print only errors and rejections");
  addChoice(app, "--log-level", {"none", "error", "warning"}, line.logLevel, LogLevel::none,
            "What is logged: none, error or warning (default)");
  addServiceOptions(app, line.host);
}

void addSubjectOptions(::CLI::App& app, Arguments& arguments) {
  auto* record = app.add_option("--record", arguments.record, "What the messages are")
                     ->type_name("TYPE")
                     ->check([](const std::string& name) {
                       if (JSON::isRecordName(name)) return std::string();
                       return fmt::format("{} is not one of {}", JSON::quote(name),
                                          fmt::join(JSON::recordNames(), ", "));
                     });
  auto* service = app.add_option("--service", arguments.service, "The service they arrived under")
                      ->type_name("ID")
                      ->excludes(record);
  auto* command = addNumber(app, "--command", arguments.command, 0,
                            std::numeric_limits<UInt64>::max(), "The command they arrived with")
                      ->excludes(record)
                      ->needs(service);
  // A service's name goes back in the error: bytes that are not text could not.
  service->needs(command)->check([](const std::string& id) {
    return Text::isUtf8(id) ? std::string() : "the identifier is not UTF-8";
  });
  app.add_option("FILE", arguments.unpack.files, "One message each; -, or none, is standard input")
      ->type_name("");
  app.add_option("--files0-from", arguments.filesFrom,
                 "Read the FILE names from FILE, a null character after each")
      ->type_name("FILE")
      ->excludes("FILE");
}

void addUnpack(::CLI::App& app, Arguments& arguments) {
  auto& unpack = *app.add_subcommand("unpack", "Unpack messages, one from each file");
  addSubjectOptions(unpack, arguments);
  auto* pretty = unpack.add_flag("--pretty", arguments.pretty, "Indent, the default on a terminal");
  unpack.add_flag("--compact", arguments.compact, "One line for each, the default elsewhere")
      ->excludes(pretty);
  unpack.add_flag("--typed", arguments.unpack.typed,
                  "Print the type of each value of a PropertyList, too");
  addHostOptions(unpack, arguments);
  unpack.footer(fmt::format(
      "TYPE is one of\n  {}\n"
      "\n"
      "Examples:\n"
      "  keelgate unpack --record VespInvitation invitation.plist\n"
      "  keelgate unpack --service com.tessen.private.braid.viso.video --command 232 <message\n"
      "\n"
      "Exit status: 0 all gave a record, 1 some were rejected, 2 wrong usage or an\n"
      "unreadable file, 3 no service. The highest that applies is used.",
      fmt::join(JSON::recordNames(), "\n  ")));
}

void addCheck(::CLI::App& app, Arguments& arguments) {
  auto& check = *app.add_subcommand("check", "Say which messages would be rejected, and why");
  addSubjectOptions(check, arguments);
  addHostOptions(check, arguments);
  check.footer(
      "Without --record or --service a message is any PropertyList.\n"
      "\n"
      "Example:\n"
      "  find . -name '*.plist' -print0 | keelgate check --files0-from -\n"
      "\n"
      "Exit status: as for unpack.");
}

void addStream(::CLI::App& app, Arguments& arguments) {
  auto& stream = *app.add_subcommand("stream", "Answer requests, one JSON object on each line");
  addHostOptions(stream, arguments);
  stream.add_option("--metrics", arguments.metrics, "Keep counters in FILE, for Prometheus")
      ->type_name("FILE");
  stream.footer(
      "A request:\n"
      "  {\"record\": TYPE, \"message\": BASE64, \"id\": ANY}\n"
      "  {\"service\": ID, \"command\": N, \"message\": BASE64, \"id\": ANY}\n"
      "\n"
      "Example:\n"
      "  echo '{\"record\":\"VespCommandResponse\",\"message\":\"'$(base64 -w0 FILE)'\"}' |\n"
      "    keelgate stream\n"
      "\n"
      "Exit status: 0, 2 when some line was not a valid request, 3 no service.");
}

void addDescribe(::CLI::App& app, Arguments& arguments) {
  auto& describe = *app.add_subcommand("describe", "Show what this build knows");
  describe.add_option("NAME", arguments.name, "A type, a service, or a command's number")
      ->type_name("");
  auto* json = describe.add_flag("--json", arguments.json, "One JSON object");
  describe
      .add_flag("--json-schema", arguments.jsonSchema, "A JSON Schema of the record, or of replies")
      ->excludes(json);
  describe.footer(
      "Examples:\n"
      "  keelgate describe VespSessionInvitation\n"
      "  keelgate describe 232\n"
      "  keelgate describe --json | jq '.services[].service'");
}

void build(::CLI::App& app, Arguments& arguments) {
  // None is right with --version alone, which is for checkUsage to see.
  app.require_subcommand(0, 1);
  app.add_flag("--version", arguments.version, "Show the version");
  app.add_flag("--verbose", arguments.verbose, "Also the service's version and sandbox layers")
      ->needs("--version");
  addServiceOptions(app, arguments.host);
  addUnpack(app, arguments);
  addCheck(app, arguments);
  addStream(app, arguments);
  addDescribe(app, arguments);
  app.footer("See `keelgate SUBCOMMAND --help` for each, with examples.");
}

[[noreturn]] void refuse(const std::string& sentence) {
  throw ::CLI::ValidationError(sentence);
}

void readFileNames(const String& from, Array<String>& files) try {
  const FileContent content(from, std::numeric_limits<std::size_t>::max());
  std::string_view names(reinterpret_cast<const char*>(content.bytes().data()),
                         content.bytes().size());
  while (!names.empty()) {
    // The last one may lack its null character.
    const std::size_t end = std::min(names.find('\0'), names.size());
    if (end == 0) refuse("--files0-from: an empty name");
    files.emplace_back(names.substr(0, end));
    names.remove_prefix(std::min(end + 1, names.size()));
  }
  if (from == "-" && std::ranges::count(files, "-") > 0) {
    refuse("--files0-from: standard input has the names, and cannot be a message too");
  }
} catch (const std::system_error& error) {
  refuse(fmt::format("--files0-from: {}: {}", from, error.code().message()));
}

/// Deliberate: the layout follows standard output alone, wherever the input comes from.
JSON::Layout layoutOf(const Arguments& arguments) {
  const Bool pretty = arguments.pretty || (!arguments.compact && isTerminal(STDOUT_FILENO));
  return pretty ? JSON::Layout::pretty : JSON::Layout::compact;
}

/// What the parser cannot be told of `unpack` and `check`.
UnpackOptions unpackOptions(const ::CLI::App& app, const Arguments& arguments) {
  const Bool checks = app.get_name() == "check";
  UnpackOptions what = arguments.unpack;
  what.layout = checks ? JSON::Layout::discarded : layoutOf(arguments);
  if (app.count("--service") > 0) {
    what.subject =
        VespClientMessageContext{.command = arguments.command, .service = arguments.service};
  } else if (app.count("--record") > 0) {
    what.subject = arguments.record;
  } else if (checks) {
    what.subject = String(JSON::propertyList);
  } else {
    throw ::CLI::RequiredError("--record, or --service with --command,");
  }
  if (what.typed && arguments.record != JSON::propertyList) {
    refuse(fmt::format("--typed belongs to --record {}", JSON::propertyList));
  }
  if (app.count("--files0-from") > 0) {
    readFileNames(arguments.filesFrom, what.files);
  } else if (what.files.empty()) {
    // As filters do: a pipe needs no file to be named.
    what.files.emplace_back("-");
  }
  if (std::ranges::count(what.files, "-") > 1) refuse("standard input can be read only once");
  return what;
}

/// Does what was parsed.
void runParsed(const ::CLI::App& app, const Arguments& arguments, std::string_view version,
               Console& console) {
  const Client::Options& host = arguments.host;
  if (app.get_subcommands().empty()) {
    if (!arguments.version) throw ::CLI::RequiredError("A subcommand");
    if (arguments.verbose) return reportVersions(version, host, console);
    console.print(fmt::format("keelgate {}\n", version));
    return;
  }
  const ::CLI::App& chosen = *app.get_subcommands().front();
  if (chosen.get_name() == "stream") return stream(host, arguments.metrics, console);
  if (chosen.get_name() == "describe") {
    // Asked for by count: an empty name is a name too, and nothing has it.
    const auto name = chosen.count("NAME") > 0 ? Optional<String>(arguments.name) : std::nullopt;
    const DescribeForm form = arguments.json         ? DescribeForm::json
                              : arguments.jsonSchema ? DescribeForm::jsonSchema
                                                     : DescribeForm::page;
    return describe(name, form, console);
  }
  unpack(host, unpackOptions(chosen, arguments), console);
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

/// What somebody may have meant with the first word that nobody took.
String hintFor(const ::CLI::App& app) {
  const auto chosen = app.get_subcommands();
  const ::CLI::App& asked = chosen.empty() ? app : *chosen.front();
  String help =
      fmt::format("see `keelgate {}--help`", chosen.empty() ? "" : asked.get_name() + " ");
  const auto left = app.remaining(true);
  if (left.empty()) return help;
  Array<String> names;
  if (left.front().starts_with('-')) {
    for (const ::CLI::Option* option : asked.get_options()) {
      for (const std::string& name : option->get_lnames()) names.push_back("--" + name);
    }
  } else if (chosen.empty()) {
    for (const ::CLI::App* each : app.get_subcommands({})) names.push_back(each->get_name());
  }
  const String word = left.front().substr(0, left.front().find('='));
  return suggestion({names.begin(), names.end()}, word, help);
}

}  // namespace

void run(Array<String> words, std::string_view version, Console& console) {
  ::CLI::App app("Unpacks untrusted messages in a sandbox and prints their records.", "keelgate");
  Arguments arguments;
  build(app, arguments);
  try {
    app.parse(reversed(std::move(words)));
    console.setLogLevel(arguments.quiet ? LogLevel::quiet : arguments.logLevel);
    runParsed(app, arguments, version, console);
  } catch (const ::CLI::Success&) {
    const auto chosen = app.get_subcommands();
    console.print(
        fitted(chosen.empty() ? app.help() : chosen.front()->help("keelgate"), outputWidth()));
  } catch (const ::CLI::ParseError& error) {
    console.complain(error.what());
    console.complain(hintFor(app));
    console.note(Status::unusable);
  }
}

}  // namespace Keelgate::CLI
