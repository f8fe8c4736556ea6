// The provider library: what a provider extension is made of.
//
//   class MyProvider : public docuvend::Provider { ... };
//
//   int main() {
//     MyProvider provider;
//     return docuvend::runProvider(provider);
//   }
//
// The program is the executable of a bundle whose Info.plist has the dictionary "QXExtension". Docuvend starts it when somebody needs it,
// confined to its own container and its groups' containers, and ends it when nobody does: whatever must last is on disk when an operation
// has returned. It may be ended at any moment, also in the middle of an operation, and is then started again by the next request.
//
// Threads. Operations may take their time and block: each runs on a thread of the library's, never on the one that answers Docuvend.
// Several run at once, so what they share must be guarded. Of one item at most one of startProviding, itemChanged, stopProviding and
// providePlaceholder runs at a time, in the order in which they were asked for; identifierForItem, itemURL and performInitialSetup run
// beside them, and are to answer within a few seconds: Docuvend ends a provider that lets it wait for these. How many it is asked for at
// once is no matter: they are begun in the order in which they were asked for, and each has its time from then.
#pragma once

#include <optional>
#include <string>
#include <variant>

#include "platform/QXError.h"
#include "platform/QXURL.h"
#include "platform/identifiers.h"

namespace docuvend {

class Provider {
 public:
  // None: done.
  using Failure = std::optional<QXError>;
  template <class T>
  using Result = std::variant<T, QXError>;

  Provider() = default;
  Provider(const Provider&) = delete;
  Provider& operator=(const Provider&) = delete;
  virtual ~Provider() = default;

  // Called before anybody is told of this provider, each time Docuvend starts or the bundle changes: make the directory "Docuvend Storage"
  // in the document group's container, and the placeholders.
  [[nodiscard]] virtual Failure performInitialSetup() = 0;
  // Make a file of the right size without the contents, if there is no file.
  [[nodiscard]] virtual Failure providePlaceholder(const QXURL& url) = 0;
  // Bring the item's contents into its file. When this returns the file has them all.
  [[nodiscard]] virtual Failure startProviding(const QXURL& url) = 0;
  // Somebody has written the item: save what it holds now.
  [[nodiscard]] virtual Failure itemChanged(const QXURL& url) = 0;
  // Nobody needs the contents for now: they may be given up, unless they are not saved yet.
  [[nodiscard]] virtual Failure stopProviding(const QXURL& url) = 0;
  // A string that names the item for ever, whatever the file is called. Not empty, and made of characters that XML can carry.
  [[nodiscard]] virtual Result<ItemID> identifierForItem(const QXURL& url) = 0;
  [[nodiscard]] virtual Result<QXURL> itemURL(const ItemID& identifier) = 0;
};

// Serves the provider over the connection that Docuvend gave to this process, until that connection ends. Returns the status to exit with:
// 0, or 64 with a message on the standard error output when this process was not started by Docuvend. The provider outlives the process's
// last operation: if one is still running a second after the connection's end, this does not return but exits.
[[nodiscard]] int runProvider(Provider& provider);

// This process's own directory, which is also its home and its working directory at the start; none when not started by Docuvend.
[[nodiscard]] std::optional<std::string> providerContainer();
// The directory of a group that this bundle belongs to, beside the containers.
[[nodiscard]] std::optional<std::string> providerGroupContainer(const std::string& group);

}  // namespace docuvend
