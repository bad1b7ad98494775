// SPDX-License-Identifier: Apache-2.0
#include "program/invitation/vesp_invitation_unpacker.h"

#include "framework/contracts/construct.h"
#include "program/invitation/invitation_conversions.h"
#include "program/schema/property_list_decoder.h"

#include <keelgate/errors.h>

namespace VespKeelgateService {

using Keelgate::construct;
using Keelgate::VespDictionaryContext;
using Keelgate::VespInvitation;
using Keelgate::VespInvitationContext;

namespace {

using Keys = VespInvitationContextSchema::CodingKeys;

template <class Payload>
VespDictionaryContextData decodeKind(const KeyedContainer& container) {
  return VespDictionaryContextClientSchema(
      container.decode<Payload>(Keys::keyOf(&VespInvitationContextSchema::contextData)));
}

/// A row of the table that chooses the kind.
struct Kind {
  std::string_view schema;
  VespDictionaryContextData (*decode)(const KeyedContainer& container);
};

/// Compared exactly: no prefix, no other case.
constexpr Kind kinds[] = {
    {"com.tessen.Vesp.schema.invitation", decodeKind<VespSampleInvitationSchema>},
    {"ht-invite-v1", decodeKind<VespHearthInvitationSchema>},
    {"com.tessen.coffersharingmessagingd", decodeKind<VespCofferSharingInvitationSchema>},
    // Deliberate: the one kind without a name of its own.
    {"1", decodeKind<VespVitalsInvitationSchema>},
    {"stride-sharing-invite", decodeKind<VespStrideSharingInvitationSchema>},
};

VespDictionaryContextData decodeContextData(const String& schema, const KeyedContainer& container) {
  for (const Kind& kind : kinds) {
    if (kind.schema == schema) return kind.decode(container);
  }
  // Thrown before the data are looked at: whatever they are, there is no kind to read them as.
  throw Keelgate::Breach("com.tessen.Keelgate.VespKeelgateService",
                         "Unknown invitation schema: (" + schema + ")");
}

}  // namespace

VespInvitationContextSchema VespInvitationContextSchema::decode(const KeyedContainer& container) {
  // The order decides which error a message with several faults gives.
  auto schema = container.decode(&VespInvitationContextSchema::schema);
  const auto contextType = container.decode(&VespInvitationContextSchema::contextType);
  auto contextData = decodeContextData(schema, container);
  return {.schema = std::move(schema),
          .contextType = contextType,
          .contextData = std::move(contextData)};
}

VespInvitation VespInvitationUnpacker::unpack(Bytes from) const {
  auto schema = PropertyListDecoder().decode<VespInvitationSchema>(from);
  auto& client = std::get<VespDictionaryContextClientSchema>(schema.context.contextData);
  VespDictionaryContext context = convertContext(std::move(client));

  return construct<VespInvitation>({
      .context = construct<VespInvitationContext>({
          .schema = std::move(schema.context.schema),
          // The only case there is: any other number was refused when it was decoded.
          .contextType = static_cast<Int>(VespInvitationContextType::dictionary),
          .context = std::move(context),
      }),
      .state = schema.state,
      .expiration = schema.expiration,
      .identifier = std::move(schema.identifier),
  });
}

VespDictionaryContext VespInvitationUnpacker::convertContext(
    VespDictionaryContextClientSchema&& kind) {
  return std::visit(
      [](auto& schema) -> VespDictionaryContext { return convertKind(std::move(schema)); }, kind);
}

}  // namespace VespKeelgateService
