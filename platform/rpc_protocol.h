// From a C++ class of operations to the wire and back.
//
// A protocol is an abstract class. Each operation is a member function returning nothing whose parameters are all `std::optional` of a
// type below, followed by one completion, a `std::function` whose parameters are of the same kind (an empty one: no reply wanted).
// One table beside the class gives each operation its full keyword name:
//
//   template <> struct QXProtocolTable<P> {
//     static constexpr std::string_view name = "P";
//     static constexpr auto operations = std::tuple{QXOperation<&P::openItem>{"openItem:completion:"}, ...};
//   };
//
// Everything else is derived from that table: the interface description, the receiving end (QXRpcExport) and the sending end (QXRemote).
//
// Types: bool, std::int64_t, double, std::string, QXData, QXURL, QXUUID, QXArray, QXDictionary, QXError, QXDescriptor, and the three
// identifiers, which travel as strings.
#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <optional>
#include <string_view>
#include <tuple>
#include <type_traits>
#include <utility>

#include "platform/QXValue.h"
#include "platform/identifiers.h"
#include "platform/rpc.h"

namespace docuvend {

template <auto Method>
struct QXOperation {
  static constexpr auto method = Method;
  std::string_view name;
};

template <class Protocol>
struct QXProtocolTable;

namespace rpc_detail {

template <class T>
concept Identifier = std::is_same_v<T, ProviderID> || std::is_same_v<T, ItemID> || std::is_same_v<T, ConsumerID>;

template <class T>
struct WireType {
  using type = T;
};
template <Identifier T>
struct WireType<T> {
  using type = std::string;
};

template <class T>
constexpr QXValueKind kindOf() {
  using W = typename WireType<T>::type;
  if constexpr (std::is_same_v<W, bool>) return QXValueKind::boolean;
  if constexpr (std::is_same_v<W, std::int64_t>) return QXValueKind::integer;
  if constexpr (std::is_same_v<W, double>) return QXValueKind::real;
  if constexpr (std::is_same_v<W, std::string>) return QXValueKind::string;
  if constexpr (std::is_same_v<W, QXData>) return QXValueKind::data;
  if constexpr (std::is_same_v<W, QXURL>) return QXValueKind::url;
  if constexpr (std::is_same_v<W, QXUUID>) return QXValueKind::uuid;
  if constexpr (std::is_same_v<W, QXArray>) return QXValueKind::array;
  if constexpr (std::is_same_v<W, QXDictionary>) return QXValueKind::dictionary;
  if constexpr (std::is_same_v<W, QXError>) return QXValueKind::error;
  if constexpr (std::is_same_v<W, QXDescriptor>) return QXValueKind::descriptor;
}

template <class T>
QXValue toWire(std::optional<T> value) {
  if (!value) return {};
  if constexpr (Identifier<T>) {
    return QXValue(std::move(value->value));
  } else {
    return QXValue(std::move(*value));
  }
}

// `value` has been checked: it is absent or of T's kind.
template <class T>
std::optional<T> fromWire(QXValue value) {
  auto* held = value.as<typename WireType<T>::type>();
  if (held == nullptr) return std::nullopt;
  if constexpr (Identifier<T>) {
    return T{std::move(*held)};
  } else {
    return std::move(*held);  // not in braces: an array would become an array of one array
  }
}

template <class... Ts>
struct TypeList {
  static constexpr std::size_t size = sizeof...(Ts);
  static std::vector<QXValueKind> kinds() { return {kindOf<Ts>()...}; }
};

template <class Completion>
struct CompletionTraits;
template <class... Rs>
struct CompletionTraits<std::function<void(std::optional<Rs>...)>> {
  using Replies = TypeList<Rs...>;

  // A reply handler in terms of values, from one in terms of types.
  static QXRpcReply toValues(std::function<void(std::optional<Rs>...)> typed) {
    if (!typed) return {};
    return [typed = std::move(typed)](QXArray values) { call(typed, std::move(values), std::index_sequence_for<Rs...>{}); };
  }
  // And the other way round.
  static std::function<void(std::optional<Rs>...)> toTypes(QXRpcReply reply) {
    if (!reply) return {};
    return [reply = std::move(reply)](std::optional<Rs>... values) {
      QXArray array;
      array.reserve(sizeof...(Rs));
      (array.push_back(toWire<Rs>(std::move(values))), ...);
      reply(std::move(array));
    };
  }

 private:
  template <std::size_t... I>
  static void call(const std::function<void(std::optional<Rs>...)>& typed, [[maybe_unused]] QXArray values, std::index_sequence<I...>) {
    typed(fromWire<Rs>(std::move(values[I]))...);
  }
};

// Splits a member function's parameters into arguments and the completion at their end.
template <class Protocol, class Done, class... Rest>
struct Split;
template <class Protocol, class... As, class Completion>
struct Split<Protocol, TypeList<As...>, Completion> {
  using ProtocolType = Protocol;
  using Arguments = TypeList<As...>;
  using CompletionType = Completion;
};
template <class Protocol, class... As, class A, class Next, class... Rest>
struct Split<Protocol, TypeList<As...>, std::optional<A>, Next, Rest...> : Split<Protocol, TypeList<As..., A>, Next, Rest...> {};

template <class Method>
struct MethodTraits;
template <class Protocol, class... Parameters>
struct MethodTraits<void (Protocol::*)(Parameters...)> : Split<Protocol, TypeList<>, Parameters...> {};

template <auto Method>
using Traits = MethodTraits<std::remove_cv_t<decltype(Method)>>;

template <auto Method>
QXRpcOperation describe(std::string_view name) {
  using T = Traits<Method>;
  return {std::string(name), T::Arguments::kinds(), CompletionTraits<typename T::CompletionType>::Replies::kinds()};
}

template <auto Method, class Protocol, class... As, std::size_t... I>
void invoke(Protocol& object, [[maybe_unused]] QXArray arguments, QXRpcReply reply, TypeList<As...>, std::index_sequence<I...>) {
  using Completion = typename Traits<Method>::CompletionType;
  (object.*Method)(fromWire<As>(std::move(arguments[I]))..., CompletionTraits<Completion>::toTypes(std::move(reply)));
}

template <auto Method, class Protocol>
constexpr std::string_view nameOf() {
  std::string_view name;
  std::apply(
      [&name](const auto&... entries) {
        ((std::is_same_v<std::remove_cvref_t<decltype(entries)>, QXOperation<Method>> ? void(name = entries.name) : void()), ...);
      },
      QXProtocolTable<Protocol>::operations);
  return name;
}

}  // namespace rpc_detail

// A fresh description of the protocol, in the table's order.
template <class Protocol>
[[nodiscard]] QXRpcInterface qxInterfaceOf() {
  std::vector<QXRpcOperation> operations;
  std::apply(
      [&operations](const auto&... entries) {
        (operations.push_back(rpc_detail::describe<std::remove_cvref_t<decltype(entries)>::method>(entries.name)), ...);
      },
      QXProtocolTable<Protocol>::operations);
  return {std::string(QXProtocolTable<Protocol>::name), std::move(operations)};
}

// Receives requests for an object that implements the protocol, and keeps it alive.
template <class Protocol>
class QXRpcExport final : public QXRpcExportedObject {
 public:
  explicit QXRpcExport(std::shared_ptr<Protocol> object) : object_(std::move(object)) {}

  [[nodiscard]] const std::shared_ptr<Protocol>& object() const { return object_; }

  void invoke(std::size_t operation, QXArray arguments, QXRpcReply reply) override {
    std::size_t index = 0;
    std::apply(
        [&](const auto&... entries) {
          ((index++ == operation ? invokeEntry(entries, std::move(arguments), std::move(reply)) : void()), ...);
        },
        QXProtocolTable<Protocol>::operations);
  }

 private:
  template <class Entry>
  void invokeEntry(const Entry&, QXArray arguments, QXRpcReply reply) {
    using Arguments = typename rpc_detail::Traits<Entry::method>::Arguments;
    rpc_detail::invoke<Entry::method>(*object_, std::move(arguments), std::move(reply), Arguments{},
                                      std::make_index_sequence<Arguments::size>{});
  }

  std::shared_ptr<Protocol> object_;
};

// Gives the connection's peer that object to talk to, kept alive by the connection, and lets its requests come.
template <class Protocol>
void qxServe(QXRpcConnection& connection, std::shared_ptr<Protocol> object, QXRpcInterface interface = qxInterfaceOf<Protocol>()) {
  connection.setExportedInterface(std::move(interface));
  connection.setExportedObject(std::make_shared<QXRpcExport<Protocol>>(std::move(object)));
  connection.resume();
}

// Sends a protocol's operations through a proxy: remote.call<&P::openItem>(url, completion).
template <class Protocol>
class QXRemote {
 public:
  explicit QXRemote(std::shared_ptr<QXRpcProxy> proxy) : proxy_(std::move(proxy)) {}

  template <auto Method, class... Given>
  void call(Given&&... values) const {
    static_assert(!rpc_detail::nameOf<Method, Protocol>().empty(), "the operation is missing from its protocol's table");
    Sender<Method, typename rpc_detail::Traits<Method>::Arguments>::send(*proxy_, std::forward<Given>(values)...);
  }

 private:
  template <auto Method, class Arguments>
  struct Sender;
  template <auto Method, class... As>
  struct Sender<Method, rpc_detail::TypeList<As...>> {
    using Completion = typename rpc_detail::Traits<Method>::CompletionType;

    static void send(QXRpcProxy& proxy, std::optional<As>... arguments, Completion completion) {
      static const QXRpcOperation operation = rpc_detail::describe<Method>(rpc_detail::nameOf<Method, Protocol>());
      QXArray values;
      values.reserve(sizeof...(As));
      (values.push_back(rpc_detail::toWire<As>(std::move(arguments))), ...);
      proxy.send(operation, std::move(values), rpc_detail::CompletionTraits<Completion>::toValues(std::move(completion)));
    }
  };

  std::shared_ptr<QXRpcProxy> proxy_;
};

}  // namespace docuvend
