#include "platform/linux/rpc/StraightURLs.h"

#include <optional>
#include <utility>

#include "platform/linux/files/StraightURL.h"

namespace docuvend::linux_platform {
namespace {

// Of all URLs, or of those that lead below a directory.
void straighten(QXArray& values, const std::optional<std::string>& below = std::nullopt) {
  for (QXValue& value : values) {
    auto* url = value.as<QXURL>();
    if (url == nullptr) continue;
    QXURL straight = straightURL(*url);
    if (!below || leadsBelow(straight, *below)) *url = std::move(straight);
  }
}

class StraightArguments final : public QXRpcExportedObject {
 public:
  StraightArguments(std::shared_ptr<QXRpcExportedObject> object, std::string below)
      : object_(std::move(object)), below_(std::move(below)) {}

  void invoke(std::size_t operation, QXArray arguments, QXRpcReply reply) override {
    straighten(arguments, below_);
    object_->invoke(operation, std::move(arguments), std::move(reply));
  }

 private:
  const std::shared_ptr<QXRpcExportedObject> object_;
  const std::string below_;
};

class StraightReplies final : public QXRpcProxy {
 public:
  explicit StraightReplies(std::shared_ptr<QXRpcProxy> proxy) : proxy_(std::move(proxy)) {}

  void send(const QXRpcOperation& operation, QXArray arguments, QXRpcReply reply) override {
    QXRpcReply straight;
    if (reply) {
      straight = [reply = std::move(reply)](QXArray values) {
        straighten(values);
        reply(std::move(values));
      };
    }
    proxy_->send(operation, std::move(arguments), std::move(straight));
  }

 private:
  const std::shared_ptr<QXRpcProxy> proxy_;
};

}  // namespace

std::shared_ptr<QXRpcExportedObject> withStraightArguments(std::shared_ptr<QXRpcExportedObject> object, std::string below) {
  if (!object) return nullptr;
  return std::make_shared<StraightArguments>(std::move(object), std::move(below));
}

std::shared_ptr<QXRpcProxy> withStraightReplies(std::shared_ptr<QXRpcProxy> proxy) {
  return std::make_shared<StraightReplies>(std::move(proxy));
}

}  // namespace docuvend::linux_platform
