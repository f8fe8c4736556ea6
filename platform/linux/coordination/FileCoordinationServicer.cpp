#include "platform/linux/coordination/FileCoordinationServicer.h"

#include "platform/linux/coordination/CoordinationErrors.h"

namespace docuvend::linux_platform {
namespace {

void answer(const FileCoordinationServicer::ErrorReply& completionHandler, std::optional<QXError> error) {
  if (completionHandler) completionHandler(std::move(error));
}

}  // namespace

void FileCoordinationServicer::writerDidFinishWritingForURL(std::optional<QXURL> url, ErrorReply completionHandler) {
  if (!url) {
    answer(completionHandler, makeCoordinationError(FileCoordinationErrorCode::missingURL, "the URL is missing", /*url=*/{}));
    return;
  }
  const auto connection = connection_.lock();
  const QXAuditToken caller = connection ? connection->auditToken() : QXAuditToken{};
  // First of all: whoever may not write the file learns nothing about it.
  if (sandbox_.checkWithoutReport(caller, kQXSandboxFileWriteData, url->fileSystemPath()) != 0) {
    answer(completionHandler, makeCoordinationError(FileCoordinationErrorCode::notPermitted, "the caller may not write the file", url));
    return;
  }
  const auto provider = coordinator_.providerOf(*url);
  if (!provider) {
    answer(completionHandler, makeCoordinationError(FileCoordinationErrorCode::noProvider, "the file belongs to no provider", url));
    return;
  }
  const int process = connection ? connection->processIdentifier() : 0;
  coordinator_.tellFinishedWriting(provider, process, *url,
                                   [completionHandler = std::move(completionHandler)] { answer(completionHandler, /*error=*/{}); });
}

}  // namespace docuvend::linux_platform
