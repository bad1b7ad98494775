// SPDX-License-Identifier: Apache-2.0
// The door that a taken-over worker has into the client: the body of a reply. The first byte says
// what the client expects, a record by its number or an error.
#include "framework/transport/error_coding.h"
#include "framework/transport/record_coding.h"

#include <keelgate/records.h>

#include <algorithm>
#include <cstdint>
#include <cstdlib>

namespace {

using namespace Keelgate;

/// One spelling for every record: what was accepted is what an honest worker would have written.
template <class R>
void checkRecord(Bytes body) {
  const Data again = Transport::encodeRecord(Transport::decodeRecord<R>(body));
  if (!std::ranges::equal(again, body)) std::abort();
}

template <class E>
void checkError(const E& error, Bytes body) {
  if (!std::ranges::equal(Transport::encodeError(error), body)) std::abort();
}

void check(std::size_t number, Bytes body) {
  OutputRecords::each([&](auto type) {
    using R = typename decltype(type)::type;
    if (number == recordNumber<R>) checkRecord<R>(body);
  });
  if (number == OutputRecords::size) Transport::throwError(body);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) return 0;
  const Bytes body = std::as_bytes(std::span(data, size)).subspan(1);
  try {
    check(data[0], body);
  } catch (const Transport::MalformedReply&) {
  } catch (const DecodingError& error) {
    checkError(error, body);
  } catch (const Breach& error) {
    checkError(error, body);
  } catch (const VespKeelgateService::VespClientMessageUnpackingError& error) {
    checkError(error, body);
  }
  return 0;
}
