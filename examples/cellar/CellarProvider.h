// A small provider whose cloud is a directory.
//
// In its own container lies the directory "cloud": the regular files directly in it are the documents, and whoever puts a file there or
// takes one away has changed the cloud. Each document has a file in "Docuvend Storage" in the container of the group
// "com.orvane.cellar.documents", under the same name: a placeholder (the right size, no contents, no blocks) until somebody needs it.
// Subdirectories and hidden files are not documents.
//
// Contents come and go by replacing the file, never by writing into it, so a reader has all of the old file or all of the new. A file that
// was opened while it was a placeholder stays a placeholder for its holder: open it after the item is provided. Contents are given up only
// while nobody has the file open, so who has them keeps them; who comes between the start and the opening and finds a placeholder again,
// because another application has let the item go, starts once more.
//
// What is written here and not yet in the cloud is never overwritten and never given up; here and in the cloud changed at once, the one
// here wins. A document that is removed here comes back as a placeholder at the next setup; one that is removed in the cloud goes here too,
// unless its contents are here. A rename on either side is carried over to the other as soon as this provider is asked for anything.
//
// For trying out what a crash does: while a file "crash-once" lies in the provider's container, the next fetch removes that file and ends
// the process by abort() when half of the document has been fetched.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "examples/cellar/CellarIndex.h"
#include "sdk/Provider.h"

namespace docuvend::cellar {

inline constexpr const char* kGroup = "com.orvane.cellar.documents";
inline constexpr const char* kErrorDomain = "CellarErrorDomain";
enum class CellarErrorCode : std::int64_t {
  notAnItem = 1,    // no document has that URL or that identifier
  notInCloud = 2,   // the document's contents are nowhere
  notSaved = 3,     // the contents are not in the cloud yet, so they are not given up
  inUse = 4,        // somebody has the document open
  noDirectory = 5,  // not started as an extension
};

class CellarProvider : public Provider {
 public:
  CellarProvider();

  [[nodiscard]] Failure performInitialSetup() override;
  [[nodiscard]] Failure providePlaceholder(const QXURL& url) override;
  [[nodiscard]] Failure startProviding(const QXURL& url) override;
  [[nodiscard]] Failure itemChanged(const QXURL& url) override;
  [[nodiscard]] Failure stopProviding(const QXURL& url) override;
  [[nodiscard]] Result<ItemID> identifierForItem(const QXURL& url) override;
  [[nodiscard]] Result<QXURL> itemURL(const ItemID& identifier) override;

 private:
  // The index with every file recognised, renames carried over and new documents taken up; saved if that changed it.
  [[nodiscard]] CellarIndex::Session openIndex();
  void carryRenamesOver(std::vector<Item>& items) const;
  // The item of a URL that lies directly in the storage, or why there is none.
  [[nodiscard]] Result<Item*> find(CellarIndex::Session& index, const QXURL& url) const;
  [[nodiscard]] static Result<Item*> find(CellarIndex::Session& index, const ItemID& identifier);

  // Puts a placeholder in the place of the item's, or where there is no file.
  [[nodiscard]] Failure makePlaceholder(Item& item) const;
  [[nodiscard]] static Failure notePlaceholder(Item& item, const Replacement& placeholder);
  // Copies the document from the cloud, in chunks, and tells which version of it that was.
  [[nodiscard]] Failure fetch(const std::string& cloudName, const UniqueDescriptor& target, Fingerprint& version) const;
  void crashIfAsked(std::uint64_t fetched, std::uint64_t size) const;
  // Copies the document for the cloud, and tells which version of it that was.
  [[nodiscard]] Failure copyForCloud(const std::string& name, const UniqueDescriptor& target, Fingerprint& version) const;

  [[nodiscard]] std::string localPath(const std::string& name) const { return storage_ + "/" + name; }
  [[nodiscard]] std::string cloudPath(const std::string& name) const { return cloud_ + "/" + name; }

  const std::string container_;
  const std::string cloud_;
  const std::string group_;
  const std::string storage_;
  CellarIndex index_;
};

}  // namespace docuvend::cellar
