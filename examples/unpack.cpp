// SPDX-License-Identifier: Apache-2.0
#include <keelgate/client.h>

#include <fstream>
#include <iostream>
#include <iterator>

int main(int count, char** words) try {
  std::ifstream file(count > 1 ? words[1] : "", std::ios::binary);
  if (!file) {
    std::cerr << "usage: unpack FILE, which has to be readable\n";
    return 2;
  }
  const std::string message(std::istreambuf_iterator<char>(file), {});
  Keelgate::Client client;
  const auto payload = client.unpack<Keelgate::PulseUserPayload>(std::as_bytes(std::span(message)));
  std::cout << "command " << payload.command << ", " << payload.ostrelMessageList.size()
            << " messages inside\n";
} catch (const Keelgate::HostError& error) {
  // The message may be without fault: the host gave it up.
  std::cerr << "given up: " << error.what() << '\n';
  return 3;
} catch (const Keelgate::Error& error) {
  std::cerr << "rejected: " << error.what() << '\n';
  return 1;
}
