// SPDX-License-Identifier: Apache-2.0
// How fast messages are checked, beside what their bytes cost at least: a copy for binary, and for
// XML two well-kept parsers that merely parse the same text and know nothing of property lists.
// Compare rows of one run only.
#include <benchmark/benchmark.h>
#include <expat.h>

#include <cstring>
#include <pugixml.hpp>

#include "plist/document.h"
#include "plist/writer.h"

using namespace PropertyList;

namespace {

Tree sample() {
  return Dictionary{{"c", 232}, {"client", "sample"}, {"date", Date{814'960'800}}, {"v", 1}};
}

Tree withKeys(std::size_t count) {
  Dictionary entries;
  for (std::size_t i = 0; i < count; ++i) {
    // Out of order, as no sorted run may be relied on.
    const std::string number = std::to_string(i * 7919 % 10'007);
    Tree value = "value " + number;
    if (i % 4 == 1) value = i;
    if (i % 4 == 2) value = i % 8 == 2;
    if (i % 4 == 3) value = Data(24, static_cast<std::byte>(i));
    entries.emplace_back("field-" + number, std::move(value));
  }
  return entries;
}

Tree withData() {
  Data data(std::size_t{4} << 20);
  for (std::size_t i = 0; i < data.size(); ++i) data[i] = static_cast<std::byte>(i * i >> 7);
  return Dictionary{{"c", 1}, {"data", std::move(data)}};
}

// Consumes bytes as often as the benchmark asks.
template <typename Work>
void measure(const std::string& name, std::string message, Work work) {
  benchmark::RegisterBenchmark(
      name.c_str(), [message = std::move(message), work](benchmark::State& state) {
        for (auto _ : state) work(message);
        state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(message.size()));
      });
}

void check(const std::string& message) {
  const Document document(std::as_bytes(std::span(message)));
  benchmark::DoNotOptimize(document.top().count());
}

void copy(const std::string& message) {
  static std::string target;
  target.resize(message.size());
  std::memcpy(target.data(), message.data(), message.size());
  benchmark::DoNotOptimize(target.data());
  benchmark::ClobberMemory();
}

void parseWithExpat(const std::string& message) {
  const XML_Parser parser = XML_ParserCreate(nullptr);
  const XML_Status status =
      XML_Parse(parser, message.data(), static_cast<int>(message.size()), XML_TRUE);
  benchmark::DoNotOptimize(status);
  XML_ParserFree(parser);
}

void parseWithPugixml(const std::string& message) {
  pugi::xml_document document;
  const auto result = document.load_buffer(message.data(), message.size());
  benchmark::DoNotOptimize(result.status);
}

void add(const std::string& name, const Tree& tree) {
  const std::vector<std::byte> bytes = writeBinary(tree);
  const std::string binary(reinterpret_cast<const char*>(bytes.data()), bytes.size());
  const std::string xml = writeXml(tree);
  measure(name + "/binary", binary, check);
  measure(name + "/binary/memcpy", binary, copy);
  measure(name + "/xml", xml, check);
  measure(name + "/xml/expat", xml, parseWithExpat);
  measure(name + "/xml/pugixml", xml, parseWithPugixml);
}

}  // namespace

int main(int count, char** arguments) {
  add("sample", sample());
  add("session20", withKeys(20));
  add("payload156", withKeys(156));
  add("keys10000", withKeys(10'000));
  add("data4MiB", withData());
  benchmark::Initialize(&count, arguments);
  if (benchmark::ReportUnrecognizedArguments(count, arguments)) return 1;
  benchmark::RunSpecifiedBenchmarks();
  return 0;
}
