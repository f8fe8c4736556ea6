#include "examples/cellar/CellarIndex.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/random.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <utility>

namespace docuvend::cellar {
namespace {

constexpr const char* kIndexName = "/index";
constexpr const char* kTemporaryName = "/.index.new";
constexpr const char* kLockName = "/index.lock";
constexpr mode_t kFileMode = 0600;
constexpr std::string_view kHeading = "cellar index 2\n";
constexpr std::size_t kFieldsPerSide = 7;
constexpr std::size_t kFields = 1 + 2 * kFieldsPerSide;
constexpr std::size_t kReadBytes = 65536;
constexpr char kHexDigits[] = "0123456789abcdef";

// Names may hold anything but "/" and NUL; a field must not hold a tab or a line feed.
std::string escaped(std::string_view name) {
  std::string result;
  for (const char c : name) {
    if (c == '%' || static_cast<unsigned char>(c) < 0x20U) {
      const auto byte = static_cast<unsigned char>(c);
      result += {'%', kHexDigits[byte >> 4U], kHexDigits[byte & 0xFU]};
    } else {
      result += c;
    }
  }
  return result;
}

std::optional<std::string> unescaped(std::string_view field) {
  std::string result;
  while (!field.empty()) {
    if (field.front() != '%') {
      result += field.front();
      field.remove_prefix(1);
      continue;
    }
    unsigned byte = 0;
    if (field.size() < 3 || std::from_chars(field.data() + 1, field.data() + 3, byte, 16).ptr != field.data() + 3) return std::nullopt;
    result += static_cast<char>(byte);
    field.remove_prefix(3);
  }
  return result;
}

void append(std::string& text, const Tracked& side) {
  const Fingerprint& print = side.fingerprint;
  text += '\t' + escaped(side.name) + '\t' + std::to_string(side.key.inode) + '\t' + std::to_string(side.key.born) + '\t' +
          std::to_string(print.key.inode) + '\t' + std::to_string(print.key.born) + '\t' + std::to_string(print.size) + '\t' +
          std::to_string(print.modified);
}

template <class Number>
bool parseNumber(std::string_view field, Number& number) {
  const auto result = std::from_chars(field.data(), field.data() + field.size(), number);
  return result.ec == std::errc() && result.ptr == field.data() + field.size();
}

bool parseSide(const std::string_view* fields, Tracked& side) {
  const auto name = unescaped(fields[0]);
  if (!name) return false;
  side.name = *name;
  Fingerprint& print = side.fingerprint;
  return parseNumber(fields[1], side.key.inode) && parseNumber(fields[2], side.key.born) && parseNumber(fields[3], print.key.inode) &&
         parseNumber(fields[4], print.key.born) && parseNumber(fields[5], print.size) && parseNumber(fields[6], print.modified);
}

std::optional<Item> parseItem(std::string_view line) {
  std::array<std::string_view, kFields> fields;
  for (std::size_t i = 0; i < kFields; ++i) {
    const std::size_t end = line.find('\t');
    if ((end == std::string_view::npos) != (i + 1 == kFields)) return std::nullopt;
    fields[i] = line.substr(0, end);
    if (end != std::string_view::npos) line.remove_prefix(end + 1);
  }
  Item item;
  item.identifier = fields[0];
  if (item.identifier.empty()) return std::nullopt;
  if (!parseSide(&fields[1], item.local) || !parseSide(&fields[1 + kFieldsPerSide], item.cloud)) return std::nullopt;
  return item;
}

void take(Tracked& side, std::vector<Entry>& entries, std::vector<Entry>::iterator entry) {
  side.isRenamed = !side.name.empty() && side.name != entry->name;
  side.name = entry->name;
  side.key = entry->fingerprint.key;
  side.present = entry->fingerprint;
  entries.erase(entry);
}

}  // namespace

std::vector<Entry> recognise(std::vector<Item>& items, Tracked Item::*side, std::vector<Entry> entries) {
  enum class By { nameAndKey, keyWhenNameIsGone, name };
  for (Item& item : items) {
    (item.*side).present.reset();
    (item.*side).isRenamed = false;
  }
  std::vector<std::string> names;
  names.reserve(entries.size());
  for (const Entry& entry : entries) names.push_back(entry.name);
  std::sort(names.begin(), names.end());

  for (const By by : {By::nameAndKey, By::keyWhenNameIsGone, By::name}) {
    for (Item& item : items) {
      Tracked& tracked = item.*side;
      if (tracked.present) continue;
      if (by == By::keyWhenNameIsGone && std::binary_search(names.begin(), names.end(), tracked.name)) continue;
      const auto found = std::find_if(entries.begin(), entries.end(), [&tracked, by](const Entry& entry) {
        const bool isNameEqual = entry.name == tracked.name;
        const bool isKeyEqual = entry.fingerprint.key == tracked.key;
        return by == By::nameAndKey ? isNameEqual && isKeyEqual : by == By::name ? isNameEqual : isKeyEqual;
      });
      if (found != entries.end()) take(tracked, entries, found);
    }
  }
  return entries;
}

std::string indexText(const std::vector<Item>& items) {
  std::string text(kHeading);
  for (const Item& item : items) {
    text += item.identifier;
    append(text, item.local);
    append(text, item.cloud);
    text += '\n';
  }
  return text;
}

std::optional<std::vector<Item>> parseIndex(std::string_view text) {
  if (!text.starts_with(kHeading)) return std::nullopt;
  text.remove_prefix(kHeading.size());
  std::vector<Item> items;
  while (!text.empty()) {
    const std::size_t end = text.find('\n');
    if (end == std::string_view::npos) return std::nullopt;
    auto item = parseItem(text.substr(0, end));
    if (!item) return std::nullopt;
    items.push_back(std::move(*item));
    text.remove_prefix(end + 1);
  }
  return items;
}

std::string newIdentifier() {
  std::array<unsigned char, 16> bytes{};
  while (getrandom(bytes.data(), bytes.size(), 0) < 0 && errno == EINTR) {
  }
  std::string result;
  for (const unsigned char byte : bytes) result += {kHexDigits[byte >> 4U], kHexDigits[byte & 0xFU]};
  return result;
}

CellarIndex::Session::Session(const std::string& directory, std::mutex& mutex) : directory_(directory), lock_(mutex) {
  fileLock_.reset(::open((directory_ + kLockName).c_str(), O_RDWR | O_CREAT | O_CLOEXEC, kFileMode));
  if (!fileLock_ || flock(fileLock_.get(), LOCK_EX) != 0) {
    error_ = systemError("cannot lock the index");
    return;
  }
  const UniqueDescriptor file(::open((directory_ + kIndexName).c_str(), O_RDONLY | O_CLOEXEC));
  if (!file) {
    if (errno != ENOENT) error_ = systemError("cannot open the index");
    return;
  }
  std::string text;
  std::array<char, kReadBytes> buffer{};
  for (ssize_t count = 0; (count = read(file.get(), buffer.data(), buffer.size())) != 0;) {
    if (count < 0) {
      error_ = systemError("cannot read the index");
      return;
    }
    text.append(buffer.data(), static_cast<std::size_t>(count));
  }
  auto items = parseIndex(text);
  if (!items) {
    error_ = QXError::system(EBADMSG, "the index is damaged");
    return;
  }
  items_ = std::move(*items);
}

std::optional<QXError> CellarIndex::Session::save() const {
  Replacement replacement(directory_ + kTemporaryName);
  const std::string text = indexText(items_);
  if (!replacement.file() || !writeAll(replacement.file(), text.data(), text.size())) return systemError("cannot write the index");
  if (auto error = replacement.sync()) return error;
  return replacement.commit(directory_ + kIndexName);
}

}  // namespace docuvend::cellar
