// The values that cross processes and property lists.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "platform/QXData.h"
#include "platform/QXError.h"
#include "platform/QXURL.h"
#include "platform/QXUUID.h"

namespace docuvend {

class QXValue;
using QXArray = std::vector<QXValue>;
using QXDictionary = std::map<std::string, QXValue, std::less<>>;

// An open file of this process. The owner closes it when the last copy goes; the number is valid as long as a copy lives.
struct QXDescriptor {
  int number = -1;
  std::shared_ptr<const void> owner;

  friend bool operator==(const QXDescriptor& a, const QXDescriptor& b) { return a.number == b.number; }
};

// The order is that of QXValue's alternatives.
enum class QXValueKind : std::uint8_t {
  absent,
  boolean,
  integer,
  real,
  string,
  data,
  url,
  uuid,
  array,
  dictionary,
  error,
  descriptor,
};

[[nodiscard]] std::string_view qxKindName(QXValueKind kind);

class QXValue {
 public:
  using Storage = std::variant<std::monostate, bool, std::int64_t, double, std::string, QXData, QXURL, QXUUID, QXArray, QXDictionary,
                               QXError, QXDescriptor>;

  QXValue() = default;
  QXValue(bool value) : storage_(value) {}
  QXValue(std::int64_t value) : storage_(value) {}
  QXValue(int value) : storage_(std::int64_t{value}) {}
  QXValue(double value) : storage_(value) {}
  QXValue(std::string value) : storage_(std::move(value)) {}
  QXValue(const char* value) : storage_(std::string(value)) {}
  QXValue(QXData value) : storage_(std::move(value)) {}
  QXValue(QXURL value) : storage_(std::move(value)) {}
  QXValue(QXUUID value) : storage_(value) {}
  QXValue(QXArray value) : storage_(std::move(value)) {}
  QXValue(QXDictionary value) : storage_(std::move(value)) {}
  QXValue(QXError value) : storage_(std::move(value)) {}
  QXValue(QXDescriptor value) : storage_(std::move(value)) {}

  [[nodiscard]] QXValueKind kind() const { return static_cast<QXValueKind>(storage_.index()); }
  [[nodiscard]] bool isAbsent() const { return storage_.index() == 0; }

  // The value when it is of that type, else null.
  template <class T>
  [[nodiscard]] const T* as() const {
    return std::get_if<T>(&storage_);
  }
  template <class T>
  [[nodiscard]] T* as() {
    return std::get_if<T>(&storage_);
  }

  // One line for people and logs.
  [[nodiscard]] std::string description() const;

  friend bool operator==(const QXValue& a, const QXValue& b) { return a.storage_ == b.storage_; }

 private:
  Storage storage_;
};

// The entry of that name when it is there and of that type, else null.
template <class T>
[[nodiscard]] const T* qxFind(const QXDictionary& dictionary, std::string_view key) {
  const auto found = dictionary.find(key);
  return found == dictionary.end() ? nullptr : found->second.as<T>();
}

}  // namespace docuvend
