// Reads one bundle's directory.
#pragma once

#include <map>
#include <string>
#include <variant>
#include <vector>

#include "platform/linux/bundles/Bundle.h"
#include "platform/linux/bundles/Seen.h"
#include "platform/property_list.h"

namespace docuvend::linux_platform {

enum class BundleOrigin { system, user };

// A bundle as its own files describe it. What depends on other bundles and on where containers lie is still empty in `bundle`.
struct ParsedBundle {
  Bundle bundle;
  BundleOrigin origin = BundleOrigin::user;  // for who knows whose directory it lies in
  std::vector<std::string> wantedGroups;
  std::map<std::string, std::vector<std::string>, std::less<>> groupMembers;  // group to identifiers of other bundles
};

// Why a directory is no bundle, in one line.
struct BundleProblem {
  std::string text;
};

// `directory` is absolute and has no link in it. A bundle has none either on the way to its property lists and its executable. An error: it
// could not be looked at (Seen.h).
[[nodiscard]] std::variant<ParsedBundle, BundleProblem, QXError> parseBundle(const std::string& directory, QXPropertyLists& propertyLists);

// As in Bundle; empty when no directory is there. Needs no descriptor.
[[nodiscard]] Seen<std::string> incarnationOf(const std::string& directory);

}  // namespace docuvend::linux_platform
