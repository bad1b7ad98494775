// SPDX-License-Identifier: Apache-2.0
/// Makes every harness's seeds and a dictionary from the field tables: fuzz_seeds FOLDER
#include "framework/json/writer.h"
#include "framework/protocol/control_frames.h"
#include "framework/protocol/data_frames.h"
#include "fuzz/messages/round_trip.h"
#include "plist/writer.h"
#include "tests/reply_frame.h"

#include <algorithm>
#include <array>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iostream>
#include <random>
#include <set>
#include <stdexcept>

namespace {

using namespace Keelgate;
using namespace Keelgate::Fuzz;

/// Every table gets some messages with nearly all of its fields and some with few.
constexpr unsigned rounds = 6;
/// Decisions for one message; the widest schema takes some 2,500.
constexpr std::size_t decisions = 6000;

class Folder {
 public:
  explicit Folder(std::filesystem::path path) : path_(std::move(path)) {}

  void add(const std::string& harness, Bytes seed) {
    std::filesystem::create_directories(path_ / harness);
    write(path_ / harness / std::to_string(++count_), seed);
  }
  void addText(const std::string& name, const std::string& text) {
    write(path_ / name, std::as_bytes(std::span(text)));
  }

 private:
  static void write(const std::filesystem::path& path, Bytes bytes) {
    std::ofstream file(path, std::ios::binary);
    file.write(reinterpret_cast<const char*>(bytes.data()),
               static_cast<std::streamsize>(bytes.size()));
    if (!file.flush()) throw std::runtime_error(path.string() + " cannot be written");
  }

  std::filesystem::path path_;
  int count_ = 0;
};

Data behind(std::size_t first, Bytes rest) {
  Data all(1 + rest.size(), static_cast<std::byte>(first));
  std::ranges::copy(rest, all.begin() + 1);
  return all;
}

void addRequest(Folder& folder, const Target& target, Bytes message) {
  JSON::Writer out(JSON::Layout::compact);
  out.beginObject();
  out.key("service");
  out.string(target.service);
  out.key("command");
  out.integer(UInt64{target.command});
  out.key("message");
  out.data(message);
  out.key("id");
  out.raw("[1.50,{\"a\":null}]");
  out.endObject();
  String text;
  for (const String& piece : std::move(out).take()) text += piece;
  text.pop_back();
  folder.add("request_fuzz", std::as_bytes(std::span(text)));
}

void addReply(Folder& folder, const Target& target, const Reply& reply) {
  const bool isRecord = reply.kind == Protocol::ReplyKind::record;
  folder.add("reply_fuzz",
             behind(isRecord ? target.record : OutputRecords::size, reply.body.bytes));
  if (reply.body.size() > 4096) return;
  // Of the frames' harness: a reply, in pieces of 41 bytes.
  Data frames{std::byte{0}, std::byte{40}};
  for (const String& line : reply.log) {
    Testing::appendReplyFrame(frames, 7, Protocol::ReplyKind::log, std::as_bytes(std::span(line)));
  }
  Testing::appendReplyFrame(frames, 7, reply.kind, reply.body.bytes);
  folder.add("frames_fuzz", frames);
}

void addMessage(Folder& folder, std::size_t which, const std::vector<std::uint8_t>& input) {
  const Target& target = targets()[which];
  Choices choices(input);
  const Tree tree = target.message(choices);
  folder.add("twins_fuzz", behind(which, std::as_bytes(std::span(input))));
  std::vector<Data> messages;
  try {
    messages.push_back(::PropertyList::writeBinary(tree));
    folder.add("plist_binary_fuzz", messages.back());
    const std::string xml = ::PropertyList::writeXml(tree);
    const Bytes bytes = std::as_bytes(std::span(xml));
    messages.emplace_back(bytes.begin(), bytes.end());
    folder.add("plist_xml_fuzz", bytes);
  } catch (const std::invalid_argument&) {
    // A tree that the encoding cannot say is a seed of the twins alone.
  }
  for (const Data& message : messages) {
    folder.add("unpack_fuzz", behind(which, message));
    addReply(folder, target, replyTo(target, message));
  }
  if (!messages.empty()) addRequest(folder, target, messages.front());
}

/// Beside an honest frame those that are not: one byte of its head is another, one is missing, one
/// is too many.
void addFrame(Folder& folder, Data seed) {
  folder.add("frames_fuzz", seed);
  for (std::size_t at = 2; at < 2 + sizeof(Protocol::ReplyHeader); ++at) {
    seed[at] ^= std::byte{1};
    folder.add("frames_fuzz", seed);
    seed[at] ^= std::byte{1};
  }
  seed.push_back({});
  folder.add("frames_fuzz", seed);
  seed.resize(seed.size() - 2);
  folder.add("frames_fuzz", seed);
}

void addFrames(Folder& folder) {
  using Protocol::ControlKind;
  using Protocol::ReplyKind;
  for (auto kind = static_cast<int>(ControlKind::hello);
       kind <= static_cast<int>(ControlKind::refused); ++kind) {
    const auto frame = Protocol::makeControlFrame(static_cast<ControlKind>(kind), 3, {1, 2, 0, 0});
    for (const std::byte hasDescriptor : {std::byte{0}, std::byte{1}}) {
      Data seed{std::byte{1}, hasDescriptor};
      const Bytes bytes = std::as_bytes(std::span(&frame, 1));
      seed.insert(seed.end(), bytes.begin(), bytes.end());
      addFrame(folder, seed);
    }
  }
  for (const bool isLast : {false, true}) {
    Data reply(2);
    for (int i = 0; i < 2 * isLast; ++i) {
      Testing::appendReplyFrame(reply, 7, ReplyKind::log, Data(5));
    }
    Testing::appendReplyFrame(reply, 7, ReplyKind::record, Data(20), isLast);
    addFrame(folder, reply);
    // In pieces of every size.
    for (std::size_t step = 1; step < reply.size(); ++step) {
      reply[1] = static_cast<std::byte>(step);
      folder.add("frames_fuzz", reply);
    }
  }
}

/// Walks every schema once, since one may hold a list of its own kind.
struct Words {
  std::set<std::string> words;
  std::set<std::string_view> schemas;

  template <class T>
  void collect() {
    if constexpr (isOptional<T> || isArray<T>) {
      collect<typename T::value_type>();
    } else if constexpr (CaseKeyed<T>) {
      [&]<std::size_t... i>(std::index_sequence<i...>) {
        (collect<std::variant_alternative_t<i, typename T::variant>>(), ...);
      }
      (std::make_index_sequence<std::variant_size_v<typename T::variant>>());
    } else if constexpr (Schema<T>) {
      if (!schemas.insert(typeName<T>()).second) return;
      for (const std::string_view key : T::CodingKeys::keys) words.emplace(key);
      T::CodingKeys::each([&](auto field) { collect<typename decltype(field)::Value>(); });
    }
  }
};

/// The wire keys and the services, which a fuzzer would take long to come upon.
std::string dictionary() {
  using namespace VespKeelgateService;
  Words all;
  MessageUnpackers::each(
      [&]<class U>(std::type_identity<U>) { all.collect<typename U::Schema>(); });
  Services::each([&]<class S>(std::type_identity<S>) {
    all.words.emplace(S::identifier);
    S::Unpacker::Commands::each(
        [&]<class Row>(std::type_identity<Row>) { all.collect<typename Row::Schema>(); });
  });
  std::string text;
  for (const std::string& word : all.words) text += '"' + word + "\"\n";
  return text;
}

}  // namespace

int main(int count, char** arguments) try {
  if (count != 2) {
    std::cerr << "usage: fuzz_seeds FOLDER\n";
    return 2;
  }
  const std::filesystem::path path = arguments[1];
  std::filesystem::remove_all(path);
  std::filesystem::create_directories(path);
  Folder folder(path);
  // Deliberate: the same numbers each time, so that the same seeds are made.
  std::mt19937 random(1);
  for (unsigned round = 0; round < rounds; ++round) {
    for (std::size_t which = 0; which < targets().size(); ++which) {
      std::vector<std::uint8_t> input(decisions >> round);
      for (std::uint8_t& byte : input) byte = static_cast<std::uint8_t>(random());
      addMessage(folder, which, input);
    }
  }
  addFrames(folder);
  folder.addText("keys.dict", dictionary());
  return 0;
} catch (const std::exception& problem) {
  std::cerr << "fuzz_seeds: " << problem.what() << '\n';
  return 1;
}
