// The index is open only while files are looked at, renamed or made, never while contents move: a long fetch keeps nobody from asking for
// an identifier. Contents move into a hidden temporary file. When it is full the index is opened again, the item is looked up by its
// identifier (its name may be another by now), and only if what justified the transfer is still so the temporary takes its place.
#include "examples/cellar/CellarProvider.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <string_view>
#include <utility>

#include "examples/cellar/Eviction.h"

namespace docuvend::cellar {
namespace {

constexpr const char* kStorageName = "/Docuvend Storage";
constexpr const char* kCloudName = "/cloud";
constexpr const char* kCrashName = "/crash-once";
constexpr std::string_view kTemporarySuffix = ".cellar-new";
constexpr std::size_t kChunk = 16384;

QXError cellarError(CellarErrorCode code, std::string description) {
  return QXError::make(kErrorDomain, static_cast<std::int64_t>(code), std::move(description));
}

QXError notSaved() { return cellarError(CellarErrorCode::notSaved, "The document is not in the cloud yet."); }

// One for each item: an item's contents move one way at a time.
std::string temporaryIn(const std::string& directory, const Item& item) {
  return directory + "/." + item.identifier + std::string(kTemporarySuffix);
}

// Copies from one file to the other and calls `onProgress` with the number of bytes so far. An error when the first file changed meanwhile.
template <class Progress>
Provider::Failure copy(const UniqueDescriptor& from, const UniqueDescriptor& to, Fingerprint& version, const Progress& onProgress) {
  const auto before = fingerprintOf(from);
  if (!before) return systemError("cannot examine a document");
  awaitLaterTime(*before);
  std::array<char, kChunk> buffer{};
  std::uint64_t copied = 0;
  for (;;) {
    const ssize_t count = read(from.get(), buffer.data(), buffer.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return systemError("cannot read a document");
    if (count == 0) break;
    if (!writeAll(to, buffer.data(), static_cast<std::size_t>(count))) return systemError("cannot write a document");
    copied += static_cast<std::uint64_t>(count);
    onProgress(copied);
  }
  if (fingerprintOf(from) != before) return QXError::system(EAGAIN, "the document was written while it was read");
  version = *before;
  return std::nullopt;
}

bool isNameTaken(const std::vector<Item>& items, Tracked Item::*side, const std::string& name) {
  return std::any_of(items.begin(), items.end(), [side, &name](const Item& item) { return (item.*side).name == name; });
}

}  // namespace

CellarProvider::CellarProvider()
    : container_(providerContainer().value_or("")),
      cloud_(container_ + kCloudName),
      group_(providerGroupContainer(kGroup).value_or("")),
      storage_(group_ + kStorageName),
      index_(container_) {
  if (container_.empty() || group_.empty()) return;
  // What an earlier process left behind.
  removeHiddenFiles(storage_, kTemporarySuffix);
  removeHiddenFiles(cloud_, kTemporarySuffix);
}

Provider::Failure CellarProvider::performInitialSetup() {
  if (container_.empty() || group_.empty()) return cellarError(CellarErrorCode::noDirectory, "There is no container.");
  if (auto error = ensureDirectory(cloud_)) return error;
  if (auto error = ensureDirectory(storage_)) return error;
  auto index = openIndex();
  if (index.error()) return index.error();

  std::erase_if(index.items(), [this](const Item& item) {
    if (item.cloud.present || (item.local.present && *item.local.present != item.local.fingerprint)) return false;
    if (item.isHere()) return false;
    if (item.local.present) unlink(localPath(item.local.name).c_str());
    return true;
  });
  for (Item& item : index.items()) {
    const bool isStale = !item.isHere() && item.isChangedInCloud();
    if (!item.cloud.present || (item.local.present && !isStale)) continue;
    if (auto error = makePlaceholder(item)) return error;
  }
  return index.save();
}

Provider::Failure CellarProvider::providePlaceholder(const QXURL& url) {
  auto index = openIndex();
  const auto found = find(index, url);
  if (const auto* error = std::get_if<QXError>(&found)) return *error;
  Item& item = *std::get<Item*>(found);
  if (item.local.present) return std::nullopt;
  if (!item.cloud.present) return cellarError(CellarErrorCode::notInCloud, "The document is not in the cloud any more.");
  if (auto error = makePlaceholder(item)) return error;
  return index.save();
}

Provider::Failure CellarProvider::startProviding(const QXURL& url) {
  Item before;
  {
    auto index = openIndex();
    const auto found = find(index, url);
    if (const auto* error = std::get_if<QXError>(&found)) return *error;
    before = *std::get<Item*>(found);
  }
  if (before.isChangedHere() || (before.isHere() && !before.isChangedInCloud())) return std::nullopt;
  if (!before.cloud.present) return cellarError(CellarErrorCode::notInCloud, "The document is not in the cloud any more.");

  Replacement replacement(temporaryIn(storage_, before));
  if (!replacement.file()) return systemError("cannot make a file for " + before.local.name);
  Fingerprint version;
  if (auto error = fetch(before.cloud.name, replacement.file(), version)) return error;
  // The document's own time, which has passed: whoever writes the file, however soon, gives it another.
  if (!setModified(replacement.file(), version.modified)) return systemError("cannot date " + before.local.name);
  if (auto error = replacement.sync()) return error;

  auto index = openIndex();
  const auto found = find(index, ItemID{before.identifier});
  if (const auto* error = std::get_if<QXError>(&found)) return *error;
  Item& item = *std::get<Item*>(found);
  // Written meanwhile: what is here now is the document.
  if (item.isChangedHere()) return std::nullopt;
  const std::string path = localPath(item.local.name);
  if (auto error = replacement.commitOver(path, item.local.present)) {
    const auto now = fingerprintAt(path);
    const bool isWrittenMeanwhile = error->code == EAGAIN && now && !now->isPlaceholder();
    return isWrittenMeanwhile ? std::nullopt : error;
  }
  const auto fingerprint = fingerprintOf(replacement.file());
  if (!fingerprint) return systemError("cannot examine " + item.local.name);
  item.local.fingerprint = *fingerprint;
  item.local.key = fingerprint->key;
  item.cloud.fingerprint = version;
  return index.save();
}

Provider::Failure CellarProvider::itemChanged(const QXURL& url) {
  Item before;
  {
    auto index = openIndex();
    const auto found = find(index, url);
    if (const auto* error = std::get_if<QXError>(&found)) return *error;
    before = *std::get<Item*>(found);
  }
  if (!before.isChangedHere()) return std::nullopt;

  Replacement replacement(temporaryIn(cloud_, before));
  if (!replacement.file()) return systemError("cannot make a file in the cloud for " + before.local.name);
  Fingerprint version;
  if (auto error = copyForCloud(before.local.name, replacement.file(), version)) return error;
  if (auto error = replacement.sync()) return error;

  auto index = openIndex();
  const auto found = find(index, ItemID{before.identifier});
  if (const auto* error = std::get_if<QXError>(&found)) return *error;
  Item& item = *std::get<Item*>(found);
  if (item.cloud.name.empty()) {
    const bool isTaken = isNameTaken(index.items(), &Item::cloud, item.local.name);
    item.cloud.name = isTaken ? item.local.name + " " + item.identifier : item.local.name;
  }
  if (auto error = replacement.commit(cloudPath(item.cloud.name))) return error;
  const auto cloudFingerprint = fingerprintOf(replacement.file());
  if (!cloudFingerprint) return systemError("cannot examine " + item.cloud.name);
  // If it was written again meanwhile it differs from this version, and the next change will send it.
  item.local.fingerprint = version;
  item.cloud.fingerprint = *cloudFingerprint;
  item.cloud.key = cloudFingerprint->key;
  return index.save();
}

Provider::Failure CellarProvider::stopProviding(const QXURL& url) {
  auto index = openIndex();
  const auto found = find(index, url);
  if (const auto* error = std::get_if<QXError>(&found)) return *error;
  Item& item = *std::get<Item*>(found);
  if (!item.isHere()) return std::nullopt;
  if (item.isChangedHere() || !item.cloud.present) return notSaved();

  // Made before the file is leased, so that nobody waits for it.
  Replacement placeholder(temporaryIn(storage_, item));
  if (auto error = placeholder.becomePlaceholder(item.cloud.present->size, item.cloud.present->modified)) return error;
  {
    const Eviction eviction(localPath(item.local.name));
    auto error = eviction.error();
    if (!error && fingerprintOf(eviction.file()) != item.local.fingerprint) return notSaved();
    if (!error) error = eviction.commit(placeholder);
    if (error && error->code == EAGAIN) return cellarError(CellarErrorCode::inUse, "Somebody has the document open.");
    if (error) return error;
  }
  if (auto error = notePlaceholder(item, placeholder)) return error;
  return index.save();
}

Provider::Result<ItemID> CellarProvider::identifierForItem(const QXURL& url) {
  auto index = openIndex();
  const auto found = find(index, url);
  if (const auto* error = std::get_if<QXError>(&found)) return *error;
  return ItemID{std::get<Item*>(found)->identifier};
}

Provider::Result<QXURL> CellarProvider::itemURL(const ItemID& identifier) {
  auto index = openIndex();
  const auto found = find(index, identifier);
  if (const auto* error = std::get_if<QXError>(&found)) return *error;
  return QXURL::fileURL(localPath(std::get<Item*>(found)->local.name), QXURLKind::file);
}

CellarIndex::Session CellarProvider::openIndex() {
  auto index = index_.open();
  if (index.error()) return index;
  std::vector<Item>& items = index.items();
  const std::string before = indexText(items);
  const std::vector<Entry> newHere = recognise(items, &Item::local, listFiles(storage_));
  const std::vector<Entry> newInCloud = recognise(items, &Item::cloud, listFiles(cloud_));
  carryRenamesOver(items);
  for (const Entry& entry : newHere) {
    Item& item = items.emplace_back();
    item.identifier = newIdentifier();
    item.local = {entry.name, entry.fingerprint.key, /*fingerprint=*/{}, entry.fingerprint};
  }
  for (const Entry& entry : newInCloud) {
    const auto sameName = std::find_if(items.begin(), items.end(), [&entry](const Item& item) { return item.local.name == entry.name; });
    // Of a document that is new on both sides the one here wins; behind another document's name one must wait until the name is free.
    if (sameName != items.end() && !sameName->cloud.name.empty()) continue;
    Item& item = sameName != items.end() ? *sameName : items.emplace_back();
    if (item.identifier.empty()) item.identifier = newIdentifier();
    item.local.name = entry.name;
    item.cloud = {entry.name, entry.fingerprint.key, entry.fingerprint, entry.fingerprint};
  }
  if (indexText(items) != before) index.noteError(index.save());
  return index;
}

void CellarProvider::carryRenamesOver(std::vector<Item>& items) const {
  for (Item& item : items) {
    if (item.local.isRenamed == item.cloud.isRenamed || !item.local.present || !item.cloud.present) continue;
    // A name that is taken on the other side stays as it is there.
    if (item.local.isRenamed && renameOverNothing(cloudPath(item.cloud.name), cloudPath(item.local.name))) {
      item.cloud.name = item.local.name;
    } else if (item.cloud.isRenamed && renameOverNothing(localPath(item.local.name), localPath(item.cloud.name))) {
      item.local.name = item.cloud.name;
    }
  }
}

Provider::Result<Item*> CellarProvider::find(CellarIndex::Session& index, const QXURL& url) const {
  if (index.error()) return *index.error();
  const std::string path = url.fileSystemPath();
  Item* found = nullptr;
  if (path.starts_with(storage_ + "/")) {
    const std::string name = path.substr(storage_.size() + 1);
    for (Item& item : index.items()) {
      // Of two that had the name in turn, the one that has it now.
      if (item.local.name == name && (found == nullptr || item.local.present)) found = &item;
    }
  }
  if (found == nullptr) return cellarError(CellarErrorCode::notAnItem, "There is no document at " + url.absoluteString() + ".");
  return found;
}

Provider::Result<Item*> CellarProvider::find(CellarIndex::Session& index, const ItemID& identifier) {
  if (index.error()) return *index.error();
  for (Item& item : index.items()) {
    if (item.identifier == identifier.value) return &item;
  }
  return cellarError(CellarErrorCode::notAnItem, "There is no document with that identifier.");
}

Provider::Failure CellarProvider::makePlaceholder(Item& item) const {
  Replacement placeholder(temporaryIn(storage_, item));
  if (auto error = placeholder.becomePlaceholder(item.cloud.present->size, item.cloud.present->modified)) return error;
  if (auto error = placeholder.commitOver(localPath(item.local.name), item.local.present)) {
    // Somebody has saved meanwhile, or another document has the name now.
    if (error->code == EAGAIN) return std::nullopt;
    return error;
  }
  return notePlaceholder(item, placeholder);
}

Provider::Failure CellarProvider::notePlaceholder(Item& item, const Replacement& placeholder) {
  const auto fingerprint = fingerprintOf(placeholder.file());
  if (!fingerprint) return systemError("cannot examine " + item.local.name);
  item.local.present = fingerprint;
  item.local.fingerprint = *fingerprint;
  item.local.key = fingerprint->key;
  item.cloud.fingerprint = *item.cloud.present;
  return std::nullopt;
}

Provider::Failure CellarProvider::fetch(const std::string& cloudName, const UniqueDescriptor& target, Fingerprint& version) const {
  const UniqueDescriptor source = openForReading(cloudPath(cloudName));
  const auto opened = source ? fingerprintOf(source) : std::nullopt;
  if (!opened) return systemError("cannot open " + cloudName + " in the cloud");
  int chunks = 0;
  auto error = copy(source, target, version, [this, &chunks, size = opened->size](std::uint64_t fetched) {
    ++chunks;
    crashIfAsked(fetched, size);
  });
  if (!error) std::fprintf(stderr, "fetched %s in %d chunks\n", cloudName.c_str(), chunks);
  return error;
}

void CellarProvider::crashIfAsked(std::uint64_t fetched, std::uint64_t size) const {
  if (fetched * 2 < size || unlink((container_ + kCrashName).c_str()) != 0) return;
  std::fputs("crashing, as the file \"crash-once\" asks\n", stderr);
  std::abort();
}

Provider::Failure CellarProvider::copyForCloud(const std::string& name, const UniqueDescriptor& target, Fingerprint& version) const {
  const UniqueDescriptor source = openForReading(localPath(name));
  if (!source) return systemError("cannot open " + name);
  return copy(source, target, version, [](std::uint64_t) {});
}

}  // namespace docuvend::cellar
