// All services of this system on Linux, put together.
//
// One process of a user holds the platform at a time.
#pragma once

#include <memory>
#include <variant>

#include "platform/QXError.h"
#include "platform/QXPlatform.h"

namespace docuvend::linux_platform {

class LinuxPlatform {
 public:
  // Fails, with one clear error, for root, without HOME or XDG_RUNTIME_DIR, and while another process holds the platform.
  [[nodiscard]] static std::variant<std::unique_ptr<LinuxPlatform>, QXError> create();
  ~LinuxPlatform();
  LinuxPlatform(const LinuxPlatform&) = delete;
  LinuxPlatform& operator=(const LinuxPlatform&) = delete;

  [[nodiscard]] QXPlatform seam();

  // Says in the log which protections this kernel gives, and opens the two services that the platform itself offers to processes:
  // "com.orvane.Sandbox" and "com.orvane.FileCoordination". Called once.
  void publishServices();

 private:
  struct Services;
  explicit LinuxPlatform(std::unique_ptr<Services> services);
  std::unique_ptr<Services> services_;
};

}  // namespace docuvend::linux_platform
