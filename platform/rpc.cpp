#include "platform/rpc.h"

#include <algorithm>

namespace docuvend {
namespace {

bool holdsOnly(const QXValue& value, const std::vector<QXValueKind>& kinds) {
  if (value.isAbsent()) return true;
  if (std::find(kinds.begin(), kinds.end(), value.kind()) == kinds.end()) return false;
  if (const auto* array = value.as<QXArray>()) {
    return std::all_of(array->begin(), array->end(), [&kinds](const QXValue& element) { return holdsOnly(element, kinds); });
  }
  if (const auto* dictionary = value.as<QXDictionary>()) {
    return std::all_of(dictionary->begin(), dictionary->end(), [&kinds](const auto& entry) { return holdsOnly(entry.second, kinds); });
  }
  return true;
}

}  // namespace

std::optional<std::size_t> QXRpcInterface::indexOf(std::string_view operationName) const {
  const auto found = std::find_if(operations_.begin(), operations_.end(),
                                  [operationName](const QXRpcOperation& operation) { return operation.name == operationName; });
  if (found == operations_.end()) return std::nullopt;
  return static_cast<std::size_t>(found - operations_.begin());
}

void QXRpcInterface::setAcceptedReplyKinds(std::string_view operationName, std::size_t position, std::vector<QXValueKind> kinds) {
  const auto found = std::find_if(restrictions_.begin(), restrictions_.end(), [&](const Restriction& restriction) {
    return restriction.operationName == operationName && restriction.position == position;
  });
  if (found != restrictions_.end()) {
    found->kinds = std::move(kinds);
  } else {
    restrictions_.push_back({std::string(operationName), position, std::move(kinds)});
  }
}

const std::vector<QXValueKind>* QXRpcInterface::acceptedReplyKinds(std::string_view operationName, std::size_t position) const {
  for (const Restriction& restriction : restrictions_) {
    if (restriction.operationName == operationName && restriction.position == position) return &restriction.kinds;
  }
  return nullptr;
}

std::optional<std::string> qxMismatch(const std::vector<QXValueKind>& kinds, const QXArray& values) {
  if (values.size() != kinds.size()) {
    return std::to_string(values.size()) + " values where " + std::to_string(kinds.size()) + " are due";
  }
  for (std::size_t i = 0; i < kinds.size(); ++i) {
    if (!values[i].isAbsent() && values[i].kind() != kinds[i]) {
      return "value " + std::to_string(i) + " is of type " + std::string(qxKindName(values[i].kind())) + " where " +
             std::string(qxKindName(kinds[i])) + " is due";
    }
  }
  return std::nullopt;
}

std::optional<std::string> qxReplyMismatch(const QXRpcInterface& interface, std::size_t operation, const QXArray& values) {
  const QXRpcOperation& description = interface.operations()[operation];
  if (auto mismatch = qxMismatch(description.replies, values)) return mismatch;
  for (std::size_t i = 0; i < values.size(); ++i) {
    const auto* kinds = interface.acceptedReplyKinds(description.name, i);
    if (kinds != nullptr && !holdsOnly(values[i], *kinds)) return "value " + std::to_string(i) + " holds a type that is not accepted there";
  }
  return std::nullopt;
}

}  // namespace docuvend
