// Who besides this user and root could change what lies at a place.
#pragma once

#include <optional>
#include <string>

namespace docuvend::ctl {

// The way to a directory and everything below it, links not followed: the first thing found that another user or another group owns or
// may write, in words. A directory on the way that only lets owners remove their own things, as /tmp does, is no such thing, and what is
// not there nobody can write.
[[nodiscard]] std::optional<std::string> writableByOthers(const std::string& directory);

}  // namespace docuvend::ctl
