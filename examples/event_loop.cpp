// SPDX-License-Identifier: Apache-2.0
// Many messages in one thread, beside whatever else an event loop waits for.
#include <keelgate/client.h>

#include <poll.h>

#include <fstream>
#include <iostream>
#include <iterator>

int main(int count, char** words) try {
  std::vector<std::string> messages;
  for (int i = 1; i < count; ++i) {
    std::ifstream file(words[i], std::ios::binary);
    messages.emplace_back(std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>());
  }
  Keelgate::Client client;
  std::size_t left = messages.size();
  for (std::size_t i = 0; i < messages.size(); ++i) {
    client.start<Keelgate::VespCommandResponse>(
        {.message = std::as_bytes(std::span(messages[i]))},
        [&left, name = words[i + 1]](Keelgate::Outcome<Keelgate::VespCommandResponse> outcome) {
          --left;
          try {
            std::cout << name << ": command " << outcome.record().command << '\n';
          } catch (const Keelgate::Error& error) {
            std::cout << name << ": " << error.what() << '\n';
          }
        });
  }
  // The application's own descriptors stand beside the client's.
  pollfd entries[] = {{.fd = client.descriptor(), .events = POLLIN, .revents = 0}};
  while (left > 0) {
    if (poll(entries, std::size(entries), -1) > 0) client.dispatch();
  }
} catch (const Keelgate::HostError& error) {
  std::cerr << "no service: " << error.what() << '\n';
  return 3;
}
