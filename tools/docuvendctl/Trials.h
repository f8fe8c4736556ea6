// What a launch needs of this machine, really tried, each in a process of its own that ends before the answer comes. For a program with
// one thread.
#pragma once

#include <optional>
#include <string>

namespace docuvend::ctl {

// Absent when it worked, else why it did not, in words.
using TrialFailure = std::optional<std::string>;

// A user namespace is made.
[[nodiscard]] TrialFailure tryUserNamespace();

// A process gives up all files with Landlock at that level, and is refused one.
[[nodiscard]] TrialFailure tryLandlock(int level);

// A process gives up the calls that no confined process may make, is refused one and makes another.
[[nodiscard]] TrialFailure trySystemCalls();

// A program of the system's is started as an extension is: with bubblewrap, docuvend-confine, and an extension's limits. Leaves nothing
// behind.
[[nodiscard]] TrialFailure tryLaunch();

// The kernel watches another socket for this user.
[[nodiscard]] TrialFailure tryWatch();

}  // namespace docuvend::ctl
