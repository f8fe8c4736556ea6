// URLs that come in from another process, under their straight names (files/StraightURL.h).
#pragma once

#include <memory>

#include "platform/rpc.h"

namespace docuvend::linux_platform {

// The object, called with every URL among the arguments made straight. Null for none.
[[nodiscard]] std::shared_ptr<QXRpcExportedObject> withStraightArguments(std::shared_ptr<QXRpcExportedObject> object);

// The proxy, whose replies have every URL among their values made straight.
[[nodiscard]] std::shared_ptr<QXRpcProxy> withStraightReplies(std::shared_ptr<QXRpcProxy> proxy);

}  // namespace docuvend::linux_platform
