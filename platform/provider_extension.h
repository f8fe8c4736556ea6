// What an installed provider extension looks like from outside: where it says that it is one, and where its items lie.
#pragma once

#include <string_view>

namespace docuvend {

inline constexpr std::string_view kQXProviderExtensionPoint = "com.orvane.docuvend-nonui";

// In a bundle's Info.plist, the dictionary about the extension, and in that the group in whose container the provided items lie.
inline constexpr std::string_view kQXExtensionDictionaryKey = "QXExtension";
inline constexpr std::string_view kQXProviderDocumentGroupKey = "QXExtensionDocuvendDocumentGroup";

// The directory of the provided items, in that container.
inline constexpr std::string_view kQXProvidedItemsDirectoryName = "Docuvend Storage";

}  // namespace docuvend
