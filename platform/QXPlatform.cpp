#include "platform/QXPlatform.h"

#include <cassert>

namespace docuvend {
namespace {

const QXPlatform*& installed() {
  static const QXPlatform* platform = nullptr;
  return platform;
}

}  // namespace

void QXPlatform::install(const QXPlatform& platform) {
  assert(installed() == nullptr);
  installed() = new QXPlatform(platform);  // for the life of the process
}

const QXPlatform& QXPlatform::current() {
  assert(installed() != nullptr);
  return *installed();
}

}  // namespace docuvend
