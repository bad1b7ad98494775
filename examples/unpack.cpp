// SPDX-License-Identifier: Apache-2.0
#include <keelgate/client.h>

#include <fstream>
#include <iostream>
#include <iterator>

int main(int, char** argv) try {
  std::ifstream file(argv[1], std::ios::binary);
  const std::string message(std::istreambuf_iterator<char>(file), {});
  Keelgate::Client client;
  const auto payload = client.unpack<Keelgate::PulseUserPayload>(std::as_bytes(std::span(message)));
  std::cout << "command " << payload.command << ", " << payload.ostrelMessageList.size()
            << " messages inside\n";
} catch (const Keelgate::DecodingError& error) {
  std::cerr << "rejected: " << error.what() << '\n';
  return 1;
}
