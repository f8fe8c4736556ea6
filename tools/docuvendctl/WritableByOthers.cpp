#include "tools/docuvendctl/WritableByOthers.h"

#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <system_error>

namespace docuvend::ctl {
namespace {

namespace fs = std::filesystem;

// A group of the user's own has nobody else in it.
bool isOwnGroup(gid_t group) { return group == 0 || group == ::getegid(); }

std::optional<std::string> problemOf(const fs::path& path) {
  struct stat status {};
  if (::lstat(path.c_str(), &status) != 0 || S_ISLNK(status.st_mode)) return std::nullopt;
  if (status.st_uid != 0 && status.st_uid != ::geteuid()) return path.string() + " belongs to another user";
  if (S_ISDIR(status.st_mode) && (status.st_mode & S_ISVTX) != 0) return std::nullopt;
  if ((status.st_mode & S_IWOTH) != 0) return path.string() + " can be written by everybody";
  if ((status.st_mode & S_IWGRP) != 0 && !isOwnGroup(status.st_gid)) return path.string() + " can be written by its group";
  return std::nullopt;
}

std::optional<std::string> problemOfWay(const fs::path& directory) {
  fs::path way;
  for (const fs::path& part : directory) {
    way /= part;
    if (auto problem = problemOf(way)) return problem;
  }
  return std::nullopt;
}

}  // namespace

std::optional<std::string> writableByOthers(const std::string& directory) {
  if (auto problem = problemOfWay(directory)) return problem;
  std::error_code error;
  fs::recursive_directory_iterator below(directory, error);
  if (error == std::errc::no_such_file_or_directory) return std::nullopt;
  for (const fs::recursive_directory_iterator end; !error && below != end; below.increment(error)) {
    if (auto problem = problemOf(below->path())) return problem;
  }
  if (error) return directory + " could not be looked through: " + error.message();
  return std::nullopt;
}

}  // namespace docuvend::ctl
