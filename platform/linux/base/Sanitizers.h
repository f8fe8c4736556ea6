// Which sanitizer this build has. The compilers say it in different ways.
#pragma once

namespace docuvend::linux_platform {

#if defined(__has_feature)
#define DOCUVEND_HAS_FEATURE(feature) __has_feature(feature)
#else
#define DOCUVEND_HAS_FEATURE(feature) 0
#endif

#if defined(__SANITIZE_ADDRESS__) || DOCUVEND_HAS_FEATURE(address_sanitizer)
inline constexpr bool kAddressSanitizer = true;
#else
inline constexpr bool kAddressSanitizer = false;
#endif

#if defined(__SANITIZE_THREAD__) || DOCUVEND_HAS_FEATURE(thread_sanitizer)
inline constexpr bool kThreadSanitizer = true;
#else
inline constexpr bool kThreadSanitizer = false;
#endif

#undef DOCUVEND_HAS_FEATURE

inline constexpr bool kSanitized = kAddressSanitizer || kThreadSanitizer;

}  // namespace docuvend::linux_platform
