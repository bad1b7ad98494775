// SPDX-License-Identifier: Apache-2.0
// What a message costs from its bytes to the record and on to the client, without processes and
// sockets, which host_bench measures. Beside each step what others take for the same contents:
// protobuf's generated classes, pugixml, and the copying of the texts alone. One thread of one
// process on a machine that has other work, too: compare rows of one run only. scripts/performance
// does, and prints the ratios.
#include "bench/messages.h"
#include "framework/server/message_memory.h"
#include "framework/transport/record_coding.h"
#include "messages.pb.h"
#include "program/payload/vesp_ostrel_payload_unpacker.h"
#include "program/schema/property_list_decoder.h"
#include "program/service/vesp_sample_message_unpacker.h"
#include "program/waymark/waymark_message_unpacker.h"

#include <benchmark/benchmark.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <cstdlib>
#include <functional>
#include <memory>
#include <new>
#include <optional>
#include <pugixml.hpp>
#include <type_traits>

namespace VespKeelgateService::Bench {

namespace {

using Keelgate::Transport::decodeRecord;
using Keelgate::Transport::lendRecord;

/// Inputs of one kind, made when the first benchmark that runs asks for them.
template <class Input>
class Inputs {
 public:
  explicit Inputs(std::function<std::vector<Input>()> make) : make_(std::move(make)) {}
  const std::vector<Input>& all() {
    if (inputs_.empty()) inputs_ = make_();
    return inputs_;
  }

 private:
  std::function<std::vector<Input>()> make_;
  std::vector<Input> inputs_;
};

template <class Input>
using SharedInputs = std::shared_ptr<Inputs<Input>>;

/// One message after the other; the time is that of one message.
template <class Input, class Work>
void measure(const std::string& name, const SharedInputs<Input>& inputs, Work work) {
  benchmark::RegisterBenchmark(name.c_str(), [inputs, work](benchmark::State& state) {
    const std::vector<Input>& all = inputs->all();
    std::size_t next = 0;
    for (auto _ : state) {
      work(all[next]);
      if (++next == all.size()) next = 0;
    }
  })->Unit(benchmark::kNanosecond);
}

/// A message that a worker has at hand: its life is the time for which the worker's allocation is
/// in use.
class AtWork {
 public:
  AtWork() {
    Keelgate::MessageMemory::begin(std::size_t{1} << 30);
    isSo_ = true;
  }
  ~AtWork() { isSo_ = false; }
  AtWork(const AtWork&) = delete;
  AtWork& operator=(const AtWork&) = delete;
  static bool isSo() { return isSo_; }

 private:
  static inline bool isSo_ = false;
};

/// What a place is made from, so that nothing is moved into it.
template <class Make>
struct MadeBy {
  Make make;
  operator std::invoke_result_t<Make>() const { return make(); }
};
template <class Make>
MadeBy(Make) -> MadeBy<Make>;

/// Like `measure`, for what a worker makes and never destroys: it exits with its answer. What
/// destroying it takes is not counted. Four at a time, so that the clock's own time is little.
template <class Input, class Make>
void measureKept(const std::string& name, const SharedInputs<Input>& inputs, Make make) {
  benchmark::RegisterBenchmark(
      name.c_str(),
      [inputs, make](benchmark::State& state) {
        using Clock = std::chrono::steady_clock;
        using Made = decltype(make(inputs->all().front()));
        const std::vector<Input>& all = inputs->all();
        std::array<std::optional<Made>, 4> made;
        std::size_t next = 0;
        for (auto _ : state) {
          const AtWork atWork;
          const auto begin = Clock::now();
          for (auto& one : made) {
            one.emplace(MadeBy{[&]() -> Made {
              return make(all[next]);
            }});
            benchmark::DoNotOptimize(*one);
            if (++next == all.size()) next = 0;
          }
          const std::chrono::duration<double> took = Clock::now() - begin;
          state.SetIterationTime(took.count() / static_cast<double>(made.size()));
          for (auto& one : made) one.reset();
        }
      })
      ->Unit(benchmark::kNanosecond)
      ->UseManualTime();
}

Bytes bytesOf(std::string_view text) {
  return std::as_bytes(std::span(text));
}

/// A record, and the reply that is made of it.
template <class Record>
struct Answer {
  template <class Unpack>
  Answer(const Unpack& unpack, Bytes message)
      : record(unpack(message)), reply(lendRecord(record).joined()) {}
  Record record;
  Data reply;
};

/// The columns for XML.
template <class Unpack>
void addXml(const std::string& name, const SharedInputs<Message>& messages, Unpack unpack) {
  using benchmark::DoNotOptimize;
  measure(name + "/pugixml", messages, [](const Message& message) {
    pugi::xml_document document;
    DoNotOptimize(document.load_buffer(message.xml.data(), message.xml.size()).status);
  });
  measure(name + "/xml-check", messages, [](const Message& message) {
    const PropertyList::Document document(bytesOf(message.xml));
    DoNotOptimize(document.top().count());
  });
  measureKept(name + "/xml-record", messages,
              [unpack](const Message& message) { return unpack(bytesOf(message.xml)); });
}

/// The columns of the table for one kind of message. `unpack(bytes)` gives its record.
template <class S, class Protobuf, class Unpack>
void add(const std::string& name, std::function<std::vector<Message>()> make, Unpack unpack) {
  const auto messages = std::make_shared<Inputs<Message>>(std::move(make));
  using benchmark::DoNotOptimize;
  measure(name + "/copy", messages, [](const Message& message) {
    for (const auto& text : message.texts) DoNotOptimize(std::vector<std::byte>(text).data());
  });
  measure(name + "/protobuf", messages, [](const Message& message) {
    Protobuf read;
    DoNotOptimize(read.ParseFromString(message.protobuf));
  });
  measure(name + "/protobuf-reply", messages, [](const Message& message) {
    Protobuf read;
    DoNotOptimize(read.ParseFromString(message.protobuf));
    DoNotOptimize(read.SerializeAsString().data());
  });
  measure(name + "/check", messages, [](const Message& message) {
    const PropertyList::Document document(message.binary);
    DoNotOptimize(document.top().count());
  });
  measureKept(name + "/schema", messages, [](const Message& message) {
    return PropertyListDecoder().decode<S>(message.binary);
  });
  measureKept(name + "/record", messages,
              [unpack](const Message& message) { return unpack(message.binary); });
  using Record = decltype(unpack(Bytes()));
  measureKept(name + "/reply", messages,
              [unpack](const Message& message) { return Answer<Record>(unpack, message.binary); });
  const auto replies = std::make_shared<Inputs<Data>>([messages, unpack] {
    std::vector<Data> all;
    for (const Message& message : messages->all()) {
      all.push_back(lendRecord(unpack(message.binary)).joined());
    }
    return all;
  });
  measure(name + "/client", replies,
          [](const Data& reply) { DoNotOptimize(decodeRecord<Record>(reply)); });
  addXml(name, messages, unpack);
}

template <class Change>
void addPayloads(const std::string& name, unsigned count, unsigned share, Change change) {
  add<VespOstrelProtocolPayload, bench::VespOstrelProtocolPayload>(
      name,
      manyOf<VespOstrelProtocolPayload, bench::VespOstrelProtocolPayload>(count, share, change),
      [](Bytes from) { return VespOstrelPayloadUnpacker().unpack(from); });
}

void addCheckIns(const std::string& name, unsigned count, unsigned share) {
  add<WaymarkSchema, bench::WaymarkSchema>(
      name,
      manyOf<WaymarkSchema, bench::WaymarkSchema>(count, share, [](WaymarkSchema&, unsigned) {}),
      [](Bytes from) {
        return WaymarkMessageUnpacker().unpack(
            from, {.command = 3, .service = "com.tessen.private.braid.waymark"});
      });
}

/// Inner payloads with some of the fields, so that a message of them is not all of one kind.
VespOstrelProtocolPayload innerPayload(unsigned seed) {
  VespOstrelProtocolPayload inner{};
  Filler<VespOstrelProtocolPayload>(seed, 5).fill(inner);
  return inner;
}

void addNested() {
  addPayloads("nested", 64, 5, [](VespOstrelProtocolPayload& outer, unsigned seed) {
    auto& list = outer.ostrelMessageList.emplace();
    for (unsigned i = 0; i < 20; ++i) list.push_back(innerPayload(1000 * seed + i));
  });
  addPayloads("deep", 16, 2, [](VespOstrelProtocolPayload& outer, unsigned seed) {
    for (unsigned i = 0; i < 100; ++i) {
      VespOstrelProtocolPayload around{};
      around.command = static_cast<Int>(seed + i);
      around.ostrelMessageList.emplace().push_back(std::move(outer));
      outer = std::move(around);
    }
  });
}

/// Keys that no field takes; the time divided by their number is what each of them costs.
void addUnknownKeys() {
  for (const std::size_t count : {1'000, 10'000, 100'000, 1'000'000}) {
    const auto message = std::make_shared<Inputs<Data>>([count] {
      PropertyList::Dictionary keys{{"c", 1}};
      for (std::size_t i = 0; i < count; ++i) keys.emplace_back("unknown-" + std::to_string(i), 7);
      return std::vector<Data>{PropertyList::writeBinary(keys)};
    });
    measureKept("unknown-" + std::to_string(count) + "/record", message,
                [](const Data& bytes) { return VespOstrelPayloadUnpacker().unpack(bytes); });
  }
}

void addAll() {
  const auto unchanged = [](auto&, unsigned) {
  };
  addPayloads("mixed", 256, 50, unchanged);
  addPayloads("sparse", 256, 5, unchanged);
  addNested();
  addCheckIns("check-in", 256, 100);
  addCheckIns("check-in-37", 256, 22);
  add<VespSampleMessageSchema, bench::VespSampleMessageSchema>(
      "sample", manyOf<VespSampleMessageSchema, bench::VespSampleMessageSchema>(256, 50, unchanged),
      [](Bytes from) {
        return VespSampleMessageUnpacker().unpack(
            from, {.command = 1, .service = "com.tessen.private.braid.rtcengine.rtctester"});
      });
  addPayloads("data-4MiB", 1, 0, [](VespOstrelProtocolPayload& payload, unsigned) {
    payload.payload.emplace(std::size_t{4} << 20, std::byte{7});
  });
  addUnknownKeys();
}

}  // namespace

}  // namespace VespKeelgateService::Bench

/// What others take is not to be counted as a worker's memory is. What is allocated for a message
/// is given back before it ends, and nothing else meanwhile.
void* operator new(std::size_t size) {
  if (VespKeelgateService::Bench::AtWork::isSo()) return Keelgate::MessageMemory::allocate(size);
  void* const block = std::malloc(std::max<std::size_t>(size, 1));
  if (block == nullptr) throw std::bad_alloc();
  return block;
}
void operator delete(void* block) noexcept {
  if (VespKeelgateService::Bench::AtWork::isSo()) return Keelgate::MessageMemory::release(block);
  std::free(block);
}
void operator delete(void* block, std::size_t) noexcept {
  operator delete(block);
}

int main(int argc, char** argv) {
  VespKeelgateService::Bench::addAll();
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  benchmark::RunSpecifiedBenchmarks();
  return 0;
}
