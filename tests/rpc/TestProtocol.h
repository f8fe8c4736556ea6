// A small protocol that uses every type.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <tuple>
#include <utility>

#include "platform/rpc_protocol.h"
#include "tests/wire/Waiting.h"

namespace docuvend::tests {

class TestProtocol {
 public:
  using Done = std::function<void()>;
  using TextReply = std::function<void(std::optional<std::string>)>;
  using ManyReply = std::function<void(std::optional<bool>, std::optional<std::int64_t>, std::optional<double>, std::optional<QXData>,
                                       std::optional<QXURL>, std::optional<QXUUID>, std::optional<QXArray>, std::optional<QXDictionary>,
                                       std::optional<QXError>, std::optional<ItemID>)>;
  using ListReply = std::function<void(std::optional<QXError>, std::optional<QXDictionary>)>;

  TestProtocol() = default;
  TestProtocol(const TestProtocol&) = delete;
  TestProtocol& operator=(const TestProtocol&) = delete;
  virtual ~TestProtocol() = default;

  virtual void echo(std::optional<std::string> text, TextReply completion) = 0;
  virtual void echoMany(std::optional<bool> flag, std::optional<std::int64_t> number, std::optional<double> real,
                        std::optional<QXData> data, std::optional<QXURL> url, std::optional<QXUUID> uuid, std::optional<QXArray> array,
                        std::optional<QXDictionary> dictionary, std::optional<QXError> error, std::optional<ItemID> item,
                        ManyReply completion) = 0;
  virtual void list(ListReply completion) = 0;
  virtual void ping(Done completion) = 0;
};

}  // namespace docuvend::tests

namespace docuvend {

template <>
struct QXProtocolTable<tests::TestProtocol> {
  using P = tests::TestProtocol;
  static constexpr std::string_view name = "TestProtocol";
  static constexpr auto operations = std::tuple{
      QXOperation<&P::echo>{"echo:completion:"},
      QXOperation<&P::echoMany>{"echoMany:number:real:data:url:uuid:array:dictionary:error:item:completion:"},
      QXOperation<&P::list>{"list:"},
      QXOperation<&P::ping>{"ping:"},
  };
};

}  // namespace docuvend

namespace docuvend::tests {

// Hands echoes and lists to the test; answers the rest at once.
class TestObject final : public TestProtocol {
 public:
  struct Echo {
    std::optional<std::string> text;
    TextReply completion;
  };

  void echo(std::optional<std::string> text, TextReply completion) override { echoes.put({std::move(text), std::move(completion)}); }
  void echoMany(std::optional<bool> flag, std::optional<std::int64_t> number, std::optional<double> real, std::optional<QXData> data,
                std::optional<QXURL> url, std::optional<QXUUID> uuid, std::optional<QXArray> array, std::optional<QXDictionary> dictionary,
                std::optional<QXError> error, std::optional<ItemID> item, ManyReply completion) override {
    completion(flag, number, real, std::move(data), std::move(url), uuid, std::move(array), std::move(dictionary), std::move(error),
               std::move(item));
  }
  void list(ListReply completion) override { lists.put(std::move(completion)); }
  void ping(Done completion) override {
    if (completion) completion();
  }

  Mailbox<Echo> echoes;
  Mailbox<ListReply> lists;
};

}  // namespace docuvend::tests
