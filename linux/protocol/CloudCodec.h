// Between the cloud's structs and the host's values of them; as Codec.h.
#pragma once

#include "linux/protocol/Codec.h"
#include "linux/protocol/LocalCloud.h"
#include "linux/protocol/cloud.capnp.h"

namespace skein::codec {

void encode(wire::CloudConditions::Builder builder, const LocalCloudConditions& conditions);
LocalCloudConditions decode(wire::CloudConditions::Reader reader);

void encode(wire::CloudKeeping::Builder builder, const LocalCloudKeeping& keeping);
LocalCloudKeeping decode(wire::CloudKeeping::Reader reader);

void encode(wire::CloudCollection::Builder builder, const LocalCloudCollection& collection);
LocalCloudCollection decode(wire::CloudCollection::Reader reader);

void encode(wire::CloudVerification::Builder builder, const LocalCloudVerification& verification);
LocalCloudVerification decode(wire::CloudVerification::Reader reader);

void encode(wire::CloudStatus::Builder builder, const LocalCloudStatus& status);
LocalCloudStatus decode(wire::CloudStatus::Reader reader);

}  // namespace skein::codec
