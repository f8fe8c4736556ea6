// How far a path may be looked up.
#pragma once

namespace docuvend::linux_platform {

// A name that the kernel has not in its cache is looked for in its directory, which may be locked by whoever changes something there. A
// lookup in the cache alone never waits for him: it says EAGAIN where the cache does not tell.
enum class Lookup { complete, inCacheAlone };

}  // namespace docuvend::linux_platform
