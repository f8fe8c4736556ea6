// Looks through the bundle directories. What is wrong with a bundle is logged once, and again only after a look that found it mended.
//
// What cannot be looked at (Seen.h) counts as what the last look found there: a bundle by itself, or all bundles of a directory that cannot
// be listed. Only what is known all the same to be gone, replaced or another user's work goes; that takes no descriptor.
//
// It may as well be a bundle by now that comes before those that are looked at after it. So among these an identifier stays with the very
// directory that the last look found it in, or is nobody's: one that was never found, or found second to another, waits for a look that
// misses nothing before it, and so does one in the place of another.
#pragma once

#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/QXLogMessage.h"
#include "platform/linux/base/Paths.h"
#include "platform/linux/bundles/BundleParser.h"
#include "platform/linux/bundles/Seen.h"
#include "platform/log.h"

namespace docuvend::linux_platform {

using BundleMap = std::map<std::string, Bundle, std::less<>>;

struct BundleLook {
  BundleMap bundles;
  std::optional<QXError> notSeen;  // the first thing that could not be looked at; another look is due
};

// Used by one thread at a time. The property lists and the log outlive it.
class BundleScan {
 public:
  BundleScan(const Paths& paths, QXPropertyLists& propertyLists, QXLogHandle& log)
      : paths_(paths), propertyLists_(propertyLists), log_(log) {}

  // Every sound bundle of the system's and then of the user's directory. Of several with one identifier the system's wins, then the
  // first by name of directory. Directories whose name begins with "." are not looked at: an installer copies under such a name, then
  // renames. Links are no bundles, nor is what another user owns or can write (distrustOf). A directory of `unsettled` is not read: it
  // counts as what the last look found there, and as nothing if that was no bundle. Creates nothing.
  [[nodiscard]] BundleLook run(const std::set<std::string>& unsettled = {});

 private:
  using Parsed = std::map<std::string, ParsedBundle>;  // by directory

  void scanDirectory(const std::string& root, BundleOrigin origin, const std::set<std::string>& unsettled, const Parsed& lastParsed);
  void scanBundle(const std::string& directory, BundleOrigin origin, const Parsed& lastParsed);
  void keep(const ParsedBundle& last);
  void add(const ParsedBundle& parsed);
  [[nodiscard]] bool wasFound(const Bundle& bundle) const;
  [[nodiscard]] BundleMap resolve();
  // The real path, or what it was when it was last seen.
  [[nodiscard]] std::string placeOf(const std::string& path);
  void missed(const QXError& error);
  void ignore(const std::string& directory, const BundleProblem& problem);
  void report(const QXLogMessage& message);

  const Paths paths_;
  QXPropertyLists& propertyLists_;
  QXLogHandle& log_;

  Parsed parsed_;                              // by the look that is going on, or else the last
  std::vector<ParsedBundle> found_;            // likewise, of each identifier the one that has it
  std::vector<ParsedBundle> lastFound_;        // by the look before that
  std::set<std::string> reported_;             // by the look that is going on
  std::set<std::string> lastReported_;         // by the one before
  std::optional<QXError> notSeen_;             // by the look that is going on
  std::map<std::string, std::string> places_;  // the real paths of containers, as they were last seen
};

// Why what the bundle is known by, its property lists, its program and the directories on the way to them, may be another user's work, in
// one line. A bundle of the system's may be root's.
[[nodiscard]] Seen<std::optional<BundleProblem>> distrustOf(const ParsedBundle& parsed);

// The real paths of the directories directly below `root` that may be bundles, in order of name.
[[nodiscard]] Seen<std::vector<std::string>> bundleDirectories(const std::string& root);

// The directory of a bundle and those below it, as they may be in the way to its files: at most kMostBundleDirectories, those nearest
// first.
inline constexpr std::size_t kMostBundleDirectories = 64;
[[nodiscard]] Seen<std::vector<std::string>> directoriesOfBundle(const std::string& directory);

}  // namespace docuvend::linux_platform
