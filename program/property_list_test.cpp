// SPDX-License-Identifier: Apache-2.0
// A property list takes no more memory than its length is worth. That it comes out as the tree that
// it is, the examples show.
#include "framework/transport/wire.h"
#include "plist/limits.h"
#include "plist/test_messages.h"
#include "program/property_list/property_list_unpacker.h"
#include "program/test_support.h"

#include <gtest/gtest.h>

namespace VespKeelgateService::Testing {

// What the service can read the client can read back.
static_assert(Keelgate::Transport::maximumNesting == PropertyList::Limits::nestedContainers);

namespace {

TEST(PropertyLists, SharedObjectsAreRefusedBeforeTheyTakeMemory) {
  // One long text, as a value or as a key, and a level of containers that doubles at each step.
  const auto shared = [](const std::string& object, const std::string& marker,
                         std::size_t references) {
    using ::PropertyList::bigEndian;
    ::PropertyList::Raw raw{{"\xaf\x11" + bigEndian(references, 2), object, "\x08"}, 2};
    for (std::size_t i = 0; i < references; ++i) {
      raw.objects[0] += bigEndian(raw.objects.size(), 2);
      raw.objects.push_back(marker);
    }
    const std::string message = raw.message();
    return errorOf([&] { PropertyListUnpacker().unpack(::PropertyList::bytesOf(message)); });
  };
  constexpr std::size_t length = 60'000;
  const std::string text =
      "\x5f\x12" + ::PropertyList::bigEndian(length, 4) + std::string(length, 'x');
  // What is made counts twice, since it is written into the reply too.
  namespace Limits = ::PropertyList::Limits;
  const std::size_t allowed =
      (Limits::expansionBase + Limits::expansionFactor * text.size()) / (2 * length);
  for (const std::string& marker :
       {::PropertyList::bytes("\xa1\x00\x01"), ::PropertyList::bytes("\xd1\x00\x01\x00\x02")}) {
    EXPECT_EQ(shared(text, marker, allowed * 4 / 5), "");
    EXPECT_EQ(shared(text, marker, allowed * 6 / 5), "dataCorrupted @");
  }

  std::vector<std::string> doubling;
  for (char i = 1; i < 60; ++i) doubling.push_back({'\xa2', i, i});
  doubling.emplace_back("\xa0");
  const std::string message = ::PropertyList::binary(doubling);
  EXPECT_EQ(errorOf([&] { PropertyListUnpacker().unpack(::PropertyList::bytesOf(message)); }),
            "dataCorrupted @");
}

}  // namespace

}  // namespace VespKeelgateService::Testing
