// How far a document is while its provider brings it.
#pragma once

#include <cstdint>
#include <functional>

namespace docuvend {

// How much of a document is there while it is being provided. A provider may begin anew: the first number may also fall.
struct Progress {
  std::uint64_t bytesPresent;
  std::uint64_t size;
};
// Called on the thread that made the call, now and then while it waits, never afterwards. Not called when nothing can be said.
using ProgressHandler = std::function<void(const Progress&)>;

}  // namespace docuvend
