// SPDX-License-Identifier: Apache-2.0
/// One tree in both encodings gives one record, or one error. The first byte says where it is sent,
/// the others decide what is in it.
#include "fuzz/messages/round_trip.h"
#include "fuzz/require.h"
#include "plist/writer.h"

#include <stdexcept>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace Keelgate::Fuzz;
  Choices choices({data, size});
  const Target& target = targets()[choices.below(targets().size())];
  const Tree tree = target.message(choices);
  std::vector<std::byte> binary;
  try {
    binary = PropertyList::writeBinary(tree);
  } catch (const std::invalid_argument&) {
    return 0;  // a date that is not finite
  }
  const std::string fromBinary = read(target, replyTo(target, binary));
  std::string xml;
  try {
    xml = PropertyList::writeXml(tree);
  } catch (const std::invalid_argument&) {
    return 0;  // a null, a UID, a control character: binary has more than XML
  }
  const std::string fromXml = read(target, replyTo(target, std::as_bytes(std::span(xml))));
  require(fromBinary == fromXml, "both encodings of a message give the same");
  return 0;
}
