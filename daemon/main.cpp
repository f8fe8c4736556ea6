// docuvendd: takes no options and reads no configuration.
#include <cstdlib>
#include <iostream>
#include <memory>
#include <variant>

#include "acl/DVAccessControlStore.h"
#include "common/DVLog.h"
#include "daemon/DVAdministrationService.h"
#include "daemon/DVServer.h"
#include "platform/QXPlatform.h"
#include "platform/linux/LinuxPlatform.h"

int main(int, char** arguments) {
  using namespace docuvend;
  auto created = linux_platform::LinuxPlatform::create();
  if (const auto* error = std::get_if<QXError>(&created)) {
    std::cerr << "docuvendd: " << error->description() << "\n";
    return EXIT_FAILURE;
  }
  auto& platform = *std::get<std::unique_ptr<linux_platform::LinuxPlatform>>(created);
  QXPlatform::install(platform.seam());

  dvLog("[NOTICE] %s starting.", arguments[0]);
  dvLog("[DEBUG] Debug logging enabled.");
  platform.publishServices();
  const auto server = std::make_shared<DVServer>();
  server->setAccessControlStore(DVAccessControlStore::sharedStore());
  // Before the server looks whether the device has been unlocked: whoever unlocks it and finds nobody to tell has been seen then.
  const auto administration = std::make_shared<DVAdministrationService>();
  administration->start();
  server->startCompletion(/*completion=*/{});
  QXPlatform::current().queues.mainRunLoop().run();
  return EXIT_SUCCESS;
}
