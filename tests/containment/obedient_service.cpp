// SPDX-License-Identifier: Apache-2.0
/// Stands for a service whose parser was taken over: the same resume(), and one unpacker that does
/// what its message says. Never shipped; a link check watches over that.
///
/// A message is a line of words:
///
///     call N [A...]    system call N with up to six arguments; its result is the answer's
///                      messageId
///     int80 N A        the same by x86-64's old 32-bit gate
///     vsyscall N       slot N of the vsyscall page
///     eat BYTES PIECE  takes and touches that much memory in pieces of so many bytes
///     address WHAT     where the program (0), its stack (1), a small block (2), a large one (3)
///                      lie
///     count            how many of these this process has been given
///     log N LENGTH     logs N lines of that length, and answers
///     fault | spin
///     answer           behaves
#include "framework/contracts/log.h"
#include "framework/contracts/process.h"
#include "framework/server/keelgate_server.h"
#include "tests/containment/machine.h"

#include <cstring>
#include <forward_list>
#include <memory>
#include <sstream>

namespace {

using namespace Keelgate;
using namespace Keelgate::Test;

/// What the link check looks for, whatever is inlined or stripped.
[[gnu::used]] constexpr char marker[] = "an unpacker that obeys";

void eat(std::size_t bytes, std::size_t piece) {
  std::forward_list<std::unique_ptr<std::byte[]>> pieces;
  for (std::size_t eaten = 0; eaten < bytes; eaten += piece) {
    pieces.push_front(std::make_unique_for_overwrite<std::byte[]>(piece));
    std::memset(pieces.front().get(), 1, piece);
  }
}

long addressOf(long what) {
  const char here = 0;
  const auto small = std::make_unique<char[]>(24);
  const auto large = std::make_unique<char[]>(1 << 22);
  // A number, which nobody is to follow.
  const auto number = [](const void* address) {
    return reinterpret_cast<long>(address);
  };
  const long all[] = {number(marker), number(&here), number(small.get()), number(large.get())};
  return all[what];
}

void misbehave(const std::string& how) {
  // Volatile, so that no compiler sees through it.
  volatile std::size_t address = 8;
  if (how == "fault") *reinterpret_cast<volatile int*>(address) = 1;
  while (how == "spin") asm volatile("");
}

/// What a message could leave behind for the next.
long messagesSeen = 0;

long obey(const std::string& order) {
  std::istringstream words(order);
  std::string verb;
  words >> verb;
  RawCall numbers{};
  for (long& number : numbers) words >> number;
  if (verb == "log") {
    const std::string line(static_cast<std::size_t>(numbers[1]), 'x');
    for (long rest = numbers[0]; rest > 0; --rest) Log::keelgate.error("%@", line);
  }
  if (verb == "count") return ++messagesSeen;
  if (verb == "call") return callKernel(numbers);
  if (verb == "int80") return callByGate(numbers[0], numbers[1]);
  if (verb == "vsyscall") return callVsyscall(numbers[0]);
  if (verb == "eat") {
    eat(static_cast<std::size_t>(numbers[0]), static_cast<std::size_t>(numbers[1]));
  }
  if (verb == "address") return addressOf(numbers[0]);
  misbehave(verb);
  return 0;
}

struct ObedientUnpacker {
  using SchemaType = VespCommandResponse;
  // NOLINTNEXTLINE(readability-convert-member-functions-to-static)
  [[nodiscard]] VespCommandResponse unpack(Bytes from) const {
    VespCommandResponse answer{};
    answer.messageId = obey({reinterpret_cast<const char*>(from.data()), from.size()});
    return answer;
  }
};

}  // namespace

int main() {
  // The first stream makes a futex call, as the first exception does.
  const std::istringstream first;
  register_for_dlsym_callbacks();
  KeelgateServer& server = KeelgateServer::service();
  server.registerUnpacker<VespCommandResponse>(ObedientUnpacker());
  server.resume(SandboxID::keelgate);
  return 0;
}
