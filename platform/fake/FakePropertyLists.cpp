#include "platform/fake/FakePropertyLists.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <filesystem>
#include <iterator>
#include <sstream>
#include <utility>

namespace docuvend::fake_platform {
namespace {

constexpr const char* kTicketPrefix = "fake-property-list-";
constexpr std::int64_t kNoPropertyListError = 300;

QXPropertyLists::ReadResult notAPropertyList() {
  return {std::nullopt, QXError::make(kQXGeneralErrorDomain, kNoPropertyListError, "The file is not a property list.")};
}

// A string that XML 1.0 can carry.
bool isCarried(const std::string& text) {
  if (!qxIsValidUTF8(text)) return false;
  if (text.find("\xEF\xBF\xBE") != std::string::npos || text.find("\xEF\xBF\xBF") != std::string::npos) return false;
  return std::none_of(text.begin(), text.end(),
                      [](char c) { return static_cast<unsigned char>(c) < 0x20 && c != '\t' && c != '\n' && c != '\r'; });
}

bool isCarried(const QXValue& value);

bool isCarried(const QXDictionary& dictionary) {
  return std::all_of(dictionary.begin(), dictionary.end(),
                     [](const auto& entry) { return isCarried(entry.first) && isCarried(entry.second); });
}

bool isCarried(const QXValue& value) {
  switch (value.kind()) {
    case QXValueKind::boolean:
    case QXValueKind::integer:
    case QXValueKind::data:
      return true;
    case QXValueKind::real:
      return std::isfinite(*value.as<double>());
    case QXValueKind::string:
      return isCarried(*value.as<std::string>());
    case QXValueKind::array: {
      const QXArray& array = *value.as<QXArray>();
      return std::all_of(array.begin(), array.end(), [](const QXValue& element) { return isCarried(element); });
    }
    case QXValueKind::dictionary:
      return isCarried(*value.as<QXDictionary>());
    case QXValueKind::absent:
    case QXValueKind::url:
    case QXValueKind::uuid:
    case QXValueKind::error:
    case QXValueKind::descriptor:
      break;
  }
  return false;
}

}  // namespace

std::unique_ptr<std::istream> FakePropertyLists::openStream(const std::string& path) {
  if (!fileSystem_.isFile(path)) return fileSystem_.isDirectory(path) ? std::make_unique<std::istream>(/*sb=*/nullptr) : nullptr;
  const std::lock_guard lock(mutex_);
  ReadResult result = notAPropertyList();
  if (const auto found = contents_.find(path); found != contents_.end()) {
    if (!found->second.hasStream) return nullptr;
    result = found->second.result;
  }
  std::string ticket = kTicketPrefix + std::to_string(tickets_.size());
  tickets_.emplace(ticket, std::move(result));
  return std::make_unique<std::istringstream>(std::move(ticket));
}

QXPropertyLists::ReadResult FakePropertyLists::read(std::istream& stream) {
  const std::string ticket{std::istreambuf_iterator<char>(stream), {}};
  const std::lock_guard lock(mutex_);
  const auto found = tickets_.find(ticket);
  return found == tickets_.end() ? notAPropertyList() : found->second;
}

bool FakePropertyLists::writeXMLAtomically(const QXDictionary& dictionary, const std::string& path) {
  const std::lock_guard lock(mutex_);
  const bool succeeded = canWrite(dictionary, path);
  writes_.push_back({path, dictionary, succeeded});
  if (!succeeded) return false;
  keepUnreadable(path);
  setContent(path, {/*hasStream=*/true, {QXValue(dictionary), std::nullopt}});
  return true;
}

void FakePropertyLists::setValue(const std::string& path, QXValue value) { setReadResult(path, {std::move(value), std::nullopt}); }

void FakePropertyLists::setCorrupt(const std::string& path) { setReadResult(path, notAPropertyList()); }

void FakePropertyLists::setReadResult(const std::string& path, ReadResult result) {
  const std::lock_guard lock(mutex_);
  setContent(path, {/*hasStream=*/true, std::move(result)});
}

void FakePropertyLists::setNoStream(const std::string& path) {
  const std::lock_guard lock(mutex_);
  setContent(path, {/*hasStream=*/false, notAPropertyList()});
}

void FakePropertyLists::failWrite(std::size_t number, FakeWriteFailure failure) {
  const std::lock_guard lock(mutex_);
  failingWrite_ = number;
  failure_ = failure;
}

std::optional<QXValue> FakePropertyLists::value(const std::string& path) const {
  if (!fileSystem_.isFile(path)) return std::nullopt;
  const std::lock_guard lock(mutex_);
  const auto found = contents_.find(path);
  if (found == contents_.end()) return std::nullopt;
  return found->second.result.value;
}

std::vector<FakePropertyLists::Write> FakePropertyLists::writes() const {
  const std::lock_guard lock(mutex_);
  return writes_;
}

std::size_t FakePropertyLists::writeCount() const {
  const std::lock_guard lock(mutex_);
  return writes_.size();
}

void FakePropertyLists::setContent(const std::string& path, Content content) {
  fileSystem_.addFile(path);
  contents_.insert_or_assign(path, std::move(content));
}

bool FakePropertyLists::canWrite(const QXDictionary& dictionary, const std::string& path) {
  const std::size_t number = writes_.size() + 1;
  if (failingWrite_ != 0 && (failure_ == FakeWriteFailure::once ? number == failingWrite_ : number >= failingWrite_)) return false;
  return isCarried(dictionary) && fileSystem_.isDirectory(std::filesystem::path(path).parent_path().string()) &&
         !fileSystem_.isDirectory(path);
}

void FakePropertyLists::keepUnreadable(const std::string& path) {
  if (!fileSystem_.isFile(path)) return;
  const auto found = contents_.find(path);
  if (found == contents_.end() || found->second.result.error) keep(path);
}

bool FakePropertyLists::keepBeside(const std::string& path) {
  const std::lock_guard lock(mutex_);
  return keep(path);
}

bool FakePropertyLists::keep(const std::string& path) {
  if (!fileSystem_.isFile(path)) return false;
  const auto found = contents_.find(path);
  int number = 1;
  while (fileSystem_.isFile(path + ".unreadable-" + std::to_string(number))) ++number;
  Content kept = found == contents_.end() ? Content{/*hasStream=*/true, notAPropertyList()} : found->second;
  setContent(path + ".unreadable-" + std::to_string(number), std::move(kept));
  return true;
}

}  // namespace docuvend::fake_platform
