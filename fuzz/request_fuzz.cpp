// SPDX-License-Identifier: Apache-2.0
/// The lines of `keelgate stream`. A request that is taken is one that can be said again, and then
/// is the same request.
#include "cli/request_line.h"
#include "framework/json/writer.h"
#include "fuzz/require.h"

#include <algorithm>
#include <cstdint>
#include <span>
#include <string>

namespace {

using namespace Keelgate;
using CLI::RequestLine;
using CLI::StreamRequest;

std::string said(const RequestLine& read) {
  const auto& request = std::get<StreamRequest>(read.content);
  JSON::Writer out(JSON::Layout::compact);
  out.beginObject();
  if (const auto* context = std::get_if<VespClientMessageContext>(&request.subject)) {
    out.key("service");
    out.string(context->service);
    out.key("command");
    out.integer(context->command);
  } else {
    out.key("record");
    out.string(std::get<String>(request.subject));
  }
  out.key("message");
  out.data(request.message);
  if (read.id) {
    out.key("id");
    out.raw(*read.id);
  }
  out.endObject();
  std::string text;
  for (const String& piece : std::move(out).take()) text += piece;
  text.pop_back();  // the newline
  return text;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  std::string line(reinterpret_cast<const char*>(data), size);
  if (line.find('\n') != line.npos) return 0;
  const RequestLine read = CLI::readRequestLine(line);
  if (!std::holds_alternative<StreamRequest>(read.content)) return 0;
  const std::string once = said(read);
  std::string copy = once;
  const RequestLine again = CLI::readRequestLine(copy);
  Fuzz::require(std::holds_alternative<StreamRequest>(again.content),
                "a request can be said again");
  Fuzz::require(said(again) == once, "a request that is said again is the same");
  return 0;
}
