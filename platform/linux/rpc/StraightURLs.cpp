#include "platform/linux/rpc/StraightURLs.h"

#include <utility>

#include "platform/linux/files/StraightURL.h"

namespace docuvend::linux_platform {
namespace {

void straighten(QXArray& values) {
  for (QXValue& value : values) {
    if (auto* url = value.as<QXURL>()) *url = straightURL(*url);
  }
}

class StraightArguments final : public QXRpcExportedObject {
 public:
  explicit StraightArguments(std::shared_ptr<QXRpcExportedObject> object) : object_(std::move(object)) {}

  void invoke(std::size_t operation, QXArray arguments, QXRpcReply reply) override {
    straighten(arguments);
    object_->invoke(operation, std::move(arguments), std::move(reply));
  }

 private:
  const std::shared_ptr<QXRpcExportedObject> object_;
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

std::shared_ptr<QXRpcExportedObject> withStraightArguments(std::shared_ptr<QXRpcExportedObject> object) {
  if (!object) return nullptr;
  return std::make_shared<StraightArguments>(std::move(object));
}

std::shared_ptr<QXRpcProxy> withStraightReplies(std::shared_ptr<QXRpcProxy> proxy) {
  return std::make_shared<StraightReplies>(std::move(proxy));
}

}  // namespace docuvend::linux_platform
