#include "platform/linux/coordination/FileCoordinationServicer.h"

#include <cerrno>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/coordination/CoordinationErrors.h"
#include "platform/sandbox.h"

namespace docuvend::linux_platform {
namespace {

using ErrorReply = QXFileCoordination::ErrorReply;

// A reply that may be called whether or not one is wanted.
ErrorReply always(ErrorReply completionHandler) {
  if (completionHandler) return completionHandler;
  return [](const std::optional<QXError>&) {};
}

std::string_view operationOf(AccessKind kind) { return kind == AccessKind::reading ? kQXSandboxFileReadData : kQXSandboxFileWriteData; }

QXError noDirectory(const QXURL& url, const QXError& reason) {
  QXError error = makeCoordinationError(FileCoordinationErrorCode::noDirectory, "the file's directory does not exist", url);
  error.underlying = std::make_shared<const QXError>(reason);
  return error;
}

QXError notPermitted(AccessKind kind, const QXURL& url) {
  const char* description = kind == AccessKind::reading ? "the caller may not read the file" : "the caller may not write the file";
  return makeCoordinationError(FileCoordinationErrorCode::notPermitted, description, url);
}

const char* nameOf(AccessKind kind) { return kind == AccessKind::reading ? "reading" : "writing"; }

const char* nameOf(AccessState state) {
  switch (state) {
    case AccessState::waiting:
      return "waiting";
    case AccessState::providing:
      return "providing";
    case AccessState::holding:
      return "holding";
  }
  return "";
}

// The caller is the provider's own process.
bool isExempt(const PeerIdentity& caller, const FileOwner& owner) {
  const std::optional<std::string> identifier = owner.provider ? owner.provider->_fileReactorID() : owner.awaited;
  return identifier && caller.bundleIdentifier == identifier;
}

// What the caller may know of an access.
QXDictionary described(const KnownAccess& known, const PeerIdentity& caller) {
  QXDictionary holder;
  holder["kind"] = nameOf(known.access.kind);
  holder["state"] = nameOf(known.state);
  holder["own"] = known.access.party.process == caller.token;
  if (caller.standing != Standing::unconfined) return holder;
  holder["processIdentifier"] = known.access.holder.processIdentifier;
  if (known.access.holder.bundleIdentifier) holder["bundleIdentifier"] = *known.access.holder.bundleIdentifier;
  return holder;
}

}  // namespace

void FileCoordinationServicer::coordinateReadingItemAtURL(std::optional<QXURL> url, std::optional<QXData> token,
                                                          std::optional<QXUUID> accessID, std::optional<std::int64_t> party,
                                                          ErrorReply completionHandler) {
  coordinate(AccessKind::reading, {std::move(url), std::move(token), accessID, party}, always(std::move(completionHandler)));
}

void FileCoordinationServicer::coordinateWritingItemAtURL(std::optional<QXURL> url, std::optional<QXData> token,
                                                          std::optional<QXUUID> accessID, std::optional<std::int64_t> party,
                                                          ErrorReply completionHandler) {
  coordinate(AccessKind::writing, {std::move(url), std::move(token), accessID, party}, always(std::move(completionHandler)));
}

void FileCoordinationServicer::coordinate(AccessKind kind, const Request& request, ErrorReply completionHandler) {
  if (auto refusal = session_->refusalOf(request.accessID)) return completionHandler(std::move(refusal));
  const auto admission = admit(kind, request.url, request.token);
  if (const auto* refusal = std::get_if<QXError>(&admission)) return completionHandler(*refusal);
  const auto& [peer, file] = std::get<Admitted>(admission);
  const PeerIdentity& caller = *peer;
  const FileOwner owner = surroundings_.coordinator.ownerOf(file, LinuxFileCoordinator::DirectoryItself::counts);
  if (isExempt(caller, owner)) {
    session_->beginExempt(*request.accessID);
    return completionHandler(/*error=*/{});
  }
  const AccessHolder holder{caller.pid, caller.bundleIdentifier};
  if (kind == AccessKind::writing) {
    if (auto refusal = surroundings_.coordinator.refusalOfWrite(owner, holder, file)) return completionHandler(std::move(refusal));
  }
  FileAccess access{file.key, file.url, kind, AccessParty{caller.token, request.party.value_or(0)}, holder};
  session_->begin(*request.accessID, std::move(access), std::move(completionHandler));
}

void FileCoordinationServicer::endAccess(std::optional<QXUUID> accessID, ErrorReply completionHandler) {
  session_->end(accessID, always(std::move(completionHandler)));
}

void FileCoordinationServicer::progressOfAccess(std::optional<QXUUID> accessID, ProgressReply completionHandler) {
  if (!completionHandler) return;
  auto progress = session_->progressOf(accessID);
  if (auto* error = std::get_if<QXError>(&progress)) return completionHandler(std::move(*error), /*bytesPresent=*/{}, /*size=*/{});
  const auto& bytes = std::get<std::optional<BytesPresent>>(progress);
  if (!bytes) return completionHandler(/*error=*/{}, /*bytesPresent=*/{}, /*size=*/{});
  completionHandler(/*error=*/{}, bytes->present, bytes->size);
}

void FileCoordinationServicer::holdersOfItemAtURL(std::optional<QXURL> url, std::optional<QXData> token, HoldersReply completionHandler) {
  if (!completionHandler) return;
  const auto admission = admit(AccessKind::reading, url, token);
  if (const auto* refusal = std::get_if<QXError>(&admission)) return completionHandler(*refusal, /*holders=*/{});
  const auto& [caller, file] = std::get<Admitted>(admission);
  QXArray holders;
  for (const KnownAccess& known : surroundings_.accesses.of(file.key, kMaximumHoldersNamed)) {
    holders.emplace_back(described(known, *caller));
  }
  completionHandler(/*error=*/{}, std::move(holders));
}

void FileCoordinationServicer::writerDidFinishWritingForURL(std::optional<QXURL> url, ErrorReply completionHandler) {
  completionHandler = always(std::move(completionHandler));
  const auto admission = admit(AccessKind::writing, url, /*token=*/{});
  if (const auto* refusal = std::get_if<QXError>(&admission)) return completionHandler(*refusal);
  const auto& [peer, file] = std::get<Admitted>(admission);
  const PeerIdentity& caller = *peer;
  if (surroundings_.accesses.isWriting(caller.token, file.key)) return completionHandler(/*error=*/{});
  const FileOwner owner = surroundings_.coordinator.ownerOf(file, LinuxFileCoordinator::DirectoryItself::counts);
  if (owner.failure) return completionHandler(owner.failure);
  if (!owner.provider && !owner.awaited) {
    return completionHandler(makeCoordinationError(FileCoordinationErrorCode::noProvider, "the file belongs to no provider", url));
  }
  if (isExempt(caller, owner)) return completionHandler(/*error=*/{});
  const AccessHolder writer{caller.pid, caller.bundleIdentifier};
  if (auto refusal = surroundings_.coordinator.refusalOfWrite(owner, writer, file)) return completionHandler(std::move(refusal));
  surroundings_.coordinator.tellFinishedWriting(owner, writer, file,
                                                [completionHandler = std::move(completionHandler)] { completionHandler(/*error=*/{}); });
}

std::variant<FileCoordinationServicer::Admitted, QXError> FileCoordinationServicer::admit(AccessKind kind, const std::optional<QXURL>& url,
                                                                                          const std::optional<QXData>& token) const {
  if (!url) return makeCoordinationError(FileCoordinationErrorCode::missingURL, "the URL is missing", /*url=*/{});
  const auto connection = connection_.lock();
  const QXAuditToken callerToken = connection ? connection->auditToken() : QXAuditToken{};
  auto caller = surroundings_.peers.find(callerToken);
  auto placed = KeyedFile::of(*url);
  if (const auto* reason = std::get_if<QXError>(&placed)) {
    // Of what is not there only an unconfined process is told: it could look for itself.
    const bool mayKnow = caller && caller->standing == Standing::unconfined && reason->code != EACCES;
    return mayKnow ? noDirectory(*url, *reason) : notPermitted(kind, *url);
  }
  auto& file = std::get<KeyedFile>(placed);
  const auto text = token ? std::optional(token->text()) : std::nullopt;
  if (!caller || !surroundings_.sandbox.mayReach(callerToken, operationOf(kind), file.url.fileSystemPath(), text))
    return notPermitted(kind, *url);
  return Admitted{std::move(caller), std::move(file)};
}

}  // namespace docuvend::linux_platform
