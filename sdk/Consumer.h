// The consumer library: what an application asks of Docuvend, as plain calls.
//
//   auto connected = Consumer::connect({});
//   if (auto* error = std::get_if<QXError>(&connected)) return fail(*error);
//   Consumer& docuvend = *std::get<std::unique_ptr<Consumer>>(connected);
//
//   auto document = docuvend.documentURL(string);                          // kept since somebody granted the document
//   if (auto* error = std::get_if<QXError>(&document)) return fail(*error);
//   const Document& letter = std::get<Document>(document);
//   auto file = docuvend.open(letter, provider, Access::read);             // the true bytes, never a placeholder's zeros
//   if (auto* error = std::get_if<QXError>(&file)) return fail(*error);
//   std::string text = readAll(std::get<QXDescriptor>(file).number);       // an ordinary open file
//   if (auto failure = docuvend.replace(letter, [&text](const QXDescriptor& to) { return writeAll(to.number, text + "PS\n"); }))
//     return fail(*failure);
//
// Who calls. A confined application is known by its launch and needs to say nothing. An unconfined program acts for nobody unless it names
// an installed bundle (Options::actAs). What a bundle may ask stands in its entitlements: "com.orvane.docuvend.acl-write" to grant, that
// one or "com.orvane.docuvend.acl-read" for providers and for providing; everything else needs none.
//
// Threads. Every call blocks the calling thread until its answer, an error, or its deadline. One Consumer may be used from several threads,
// all over one connection to each service; it must not go while a call runs. The library has one thread of its own, on which nothing of
// the caller's runs: handlers run on the thread that made the call, and must not throw. A process that forks leaves the Consumer, and what
// it gave, to the parent: the child calls exec or _exit.
//
// Deadlines. Options has those of all calls; `within` makes the same calls with another:
//
//   docuvend.within(2s).documentURL(string)
//
// A call whose deadline has passed may still take effect; its late answer is dropped, with the file that may have come in it. Only a wait
// for a file's turn leaves nothing behind: the library gives the turn up.
//
// Restarts of the daemon. A Consumer outlives them. A call that finds its connection ended, or no daemon, waits for a new one: no longer
// than Options::restartPatience and its deadline, then it is `unreachable`. If the daemon ends with a request in hand, the library asks
// once more where that is harmless: wakeUp, extendSandbox, providePlaceholder, startProviding, providers, extendBookmark,
// bookmarkableString, documentURL, redeem, open, finishedWriting, coordinateReading, coordinateWriting, holders. stopProviding, which might
// undo what somebody else began meanwhile, and the last step of replace are not repeated: their error is `connectionLost`, and they may
// have taken effect.
//
// Errors. The library's own are in ConsumerErrors.h. All others are answers as they came: DVErrorDomain (common/DVErrorCodes.h) from the
// daemon, with a provider's own error beneath code 7; QXSandboxErrorDomain (platform/linux/wire/SandboxProtocol.h) when a token opens
// nothing; QXFileCoordinationErrorDomain (platform/linux/wire/FileCoordinationProtocol.h) when a file's turn cannot be had;
// QXRpcErrorDomain (platform/rpc_errors.h) when the daemon refuses the connection or a request is too large; QXSystemErrorDomain, with an
// errno value, from the system. What each call adds stands beside it.
#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/QXValue.h"
#include "platform/identifiers.h"
#include "sdk/ConsumerErrors.h"
#include "sdk/CoordinatedAccess.h"
#include "sdk/Progress.h"
#include "sdk/Result.h"

namespace docuvend {

namespace sdk_detail {
class ServiceConnections;
}

enum class Access { read, readWrite };

// A document, and what opens it. May be kept and copied; the tokens are as good as the file to whoever has them. They last until the
// session ends or a grant of the same provider is revoked: then opening fails with QXSandboxErrorDomain's badToken (1) and new ones must be
// asked for, which the library does itself for a document that has its string.
struct Document {
  QXURL url;
  std::optional<QXData> itemToken;
  std::optional<QXURL> siblingURL;
  std::optional<QXData> siblingToken;
  // The string that it was asked for by, if it was.
  std::optional<std::string> bookmarkableString = std::nullopt;
};

class Consumer {
 public:
  struct Options {
    // For an unconfined program: the installed bundle that it acts for. A confined one is known by its launch.
    std::optional<std::string> actAs;
    std::chrono::milliseconds deadline{30'000};
    // Materialising a document may take longer than an answer: for startProviding, for open as a whole, and for the beginning of an access.
    std::chrono::milliseconds materialisingDeadline{600'000};
    // How long a call waits for a daemon that is not there.
    std::chrono::milliseconds restartPatience{5'000};
  };

  // `unreachable` at once when XDG_RUNTIME_DIR is not set or no daemon is there.
  [[nodiscard]] static Result<std::unique_ptr<Consumer>> connect(Options options);
  ~Consumer();
  Consumer(const Consumer&) = delete;
  Consumer& operator=(const Consumer&) = delete;

  // The same connections with another deadline, which holds for each call as a whole.
  [[nodiscard]] Consumer within(std::chrono::milliseconds deadline) const;

  // The bundle that this process acts for: the one in the options, else the one it was launched as.
  [[nodiscard]] std::optional<ConsumerID> ownIdentifier() const;

  // Makes sure that the daemon runs.
  [[nodiscard]] Failure wakeUp();
  // Grants the consumer a provider's item, which is on disk when this returns, and asks tokens for it. A token is absent when the platform
  // issued none.
  [[nodiscard]] Result<Document> extendSandbox(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& toConsumer);

  // These three are for a consumer that has been granted the item, but for the last one, which everybody may ask.
  //
  // Has the provider make a placeholder for the item: a file of the right size without the contents.
  [[nodiscard]] Failure providePlaceholder(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& forConsumer);
  // Has the provider bring the item's contents into its file. Progress is what this process sees at the URL's path: a confined one
  // sees nothing there, and is told nothing.
  [[nodiscard]] Failure startProviding(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& forConsumer,
                                       const ProgressHandler& progress = {});
  // Tells the provider that the consumer needs the item's contents no longer.
  [[nodiscard]] Failure stopProviding(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& forConsumer);

  // Keyed by provider identifier; each value a dictionary with the URL "documentStorageURL" and the string "providerIdentifier", or less.
  [[nodiscard]] Result<QXDictionary> providers();
  // Grants a document that this application may write to another one; the string by which that one finds it.
  [[nodiscard]] Result<std::string> extendBookmark(const QXURL& url, const ConsumerID& toConsumer);
  // The string that names the document wherever it will lie. `noAnswer`: no provider owns the URL.
  [[nodiscard]] Result<std::string> bookmarkableString(const QXURL& url);
  // The way back, for the consumer to whom the document is granted, with tokens. The daemon answers nothing while the provider that the
  // string names is not there: then it is `deadlinePassed`.
  [[nodiscard]] Result<Document> documentURL(const std::string& bookmarkableString);

  // The open file that the token names, in blocking mode, with its offset at 0. Says nothing about the contents: a placeholder reads as
  // zeros. While somebody holds the file in a way that would make an open wait, it is tried again; `deadlinePassed` then stands above
  // the reason.
  [[nodiscard]] Result<QXDescriptor> redeem(const QXData& token, Access access);
  // Has the provider materialise the document for this application, then redeems. `noToken` when the document has none or this process acts
  // for no bundle; otherwise the errors of startProviding, redeem, and documentURL when tokens must be asked for anew.
  [[nodiscard]] Result<QXDescriptor> open(const Document& document, const ProviderID& provider, Access access,
                                          const ProgressHandler& progress = {});

  // Saves so that a reader sees the old contents or the new, also after a power failure: `write` fills an empty file beside the item (its
  // hidden sibling), which then takes the item's place with its permissions, and the provider is told. The time that `write` takes does
  // not count.
  //
  // Of several who save one item through this library at once each waits for the one before it, so the last one's contents stay. The
  // others need not be in this process, but a program that writes the sibling without taking the locks (flock, of the item and of the
  // sibling) is not kept out, and a process that is killed within the last step leaves that to the daemon without them.
  //
  // Failures. `noToken`; `deadlinePassed` while somebody else is saving; an error of redeem, of emptying the sibling, or
  // what `write` returns to give up: the item is untouched. Then, of putting the sibling in its place: `unreachable` and of
  // QXSandboxErrorDomain badToken (1), notRegularFile (2), notPermitted (5) and notSiblings (6) leave it untouched; after anything else
  // it has the old contents or the new. `notTold`: it has the new ones; call finishedWriting again.
  //
  // Takes no turn at the file: who has read what it writes, and must not lose what others write meanwhile, does both within one
  // coordinateWriting. There the provider is not told by this call but, once, by the access's end.
  [[nodiscard]] Failure replace(const Document& document, const std::function<Failure(const QXDescriptor&)>& write);
  // Tells file coordination that this process has written the document in place, so that its provider hears of the change. Takes no turn
  // either; within a write access of this process, whose end tells the provider, nothing remains to be told.
  [[nodiscard]] Failure finishedWriting(const QXURL& url);

  // These two wait for this caller's turn at the file among all processes that take turns (sdk/CoordinatedAccess.h), and of a read that the
  // file's provider has brought its contents; then the caller opens the file, by its path or by a token, and ends the access when it is
  // done. The file need not be there, nor be a provider's. A document's token is sent with the request, and renewed when it has become
  // worthless.
  //
  // Failures. `deadlinePassed`: the library has given the turn up. Of QXFileCoordinationErrorDomain: notPermitted (2), this process can
  // reach the file in that way neither by its path nor by the token; wouldDeadlock (5), those who have the file wait for this thread's
  // accesses: end them and try again; ended (6), the daemon has given the turn up; tooManyAccesses (7), of this Consumer's connection
  // or of the application; tooManyChanges (9), of a write: the provider has not been told yet of too much that the application has written;
  // noDirectory (8), there is none where the file would be; noProvider (3), only an uninstalled provider could bring the contents. Of
  // DVErrorDomain: the provider could not bring the contents (7), or is not there.
  [[nodiscard]] Result<CoordinatedAccess> coordinateReading(const QXURL& url, const CoordinationOptions& options = {});
  [[nodiscard]] Result<CoordinatedAccess> coordinateReading(const Document& document, const CoordinationOptions& options = {});
  [[nodiscard]] Result<CoordinatedAccess> coordinateWriting(const QXURL& url, const CoordinationOptions& options = {});
  [[nodiscard]] Result<CoordinatedAccess> coordinateWriting(const Document& document, const CoordinationOptions& options = {});
  // Who accesses the file: those who have it, then those who wait for it, in their order. For who can read it, or has a token for it;
  // else of QXFileCoordinationErrorDomain notPermitted (2), or noDirectory (8).
  [[nodiscard]] Result<std::vector<FileHolder>> holders(const QXURL& url, const std::optional<QXData>& token = std::nullopt);

 private:
  Consumer(std::shared_ptr<sdk_detail::ServiceConnections> services, Options options);

  // startProviding, with something to be done now and then while it waits.
  [[nodiscard]] Failure start(const QXURL& url, const ProviderID& fromProvider, const ConsumerID& forConsumer,
                              const std::function<void()>& watch);
  [[nodiscard]] Result<CoordinatedAccess> coordinate(CoordinationKind kind, const Document& document, const CoordinationOptions& options);
  [[nodiscard]] Result<CoordinatedAccess> coordinate(CoordinationKind kind, const QXURL& url, const CoordinationOptions& options,
                                                     std::chrono::milliseconds deadline);

  const std::shared_ptr<sdk_detail::ServiceConnections> services_;
  const Options options_;
};

}  // namespace docuvend
