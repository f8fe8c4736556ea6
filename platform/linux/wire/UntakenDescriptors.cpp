#include "platform/linux/wire/UntakenDescriptors.h"

#include <linux/sockios.h>
#include <sys/ioctl.h>

#include "platform/linux/wire/Limits.h"

// What lies in a socket is asked of the kernel, and only when there seems to be no room: a peer that takes its answers costs nothing then,
// and one that keeps few of them is never asked about.
//
// The kernel says how much memory of the sending socket's share is held by what the peer has not taken. A message holds more than its
// bytes, for the kernel writes down about each what is longer than kLightestMessage. So no more messages are left than that goes into what
// is held: the last ones, for a stream is taken in its order.

namespace docuvend::linux_platform {
namespace {

constexpr std::size_t kLightestMessage = 512;
// What a socket with the narrowest of buffers, 4608 bytes, may hold and be writable: a quarter of it.
constexpr std::size_t kUnseenMessages = 2;
static_assert(kMaximumUntakenAnswers > kUnseenMessages);

}  // namespace

std::unique_ptr<UntakenDescriptors::Share> UntakenDescriptors::take(const Socket& socket, std::size_t count) {
  {
    const std::lock_guard lock(mutex_);
    if (count_ + count > limit_) syncLookAtAll();
    if (count_ + count > limit_) return nullptr;
    count_ += count;
    ++sockets_[socket].due;
  }
  return std::make_unique<Share>(shared_from_this(), socket, count);
}

void UntakenDescriptors::leave(const Socket& socket, std::size_t count, bool isSent) {
  const std::lock_guard lock(mutex_);
  const auto found = sockets_.find(socket);
  OfSocket& of = found->second;
  --of.due;
  if (isSent) {
    of.sent.push_back(count);
    return;
  }
  count_ -= count;
  if (of.due == 0 && of.sent.empty()) sockets_.erase(found);
}

UntakenDescriptors::Room UntakenDescriptors::roomOf(const Socket& socket) {
  const std::lock_guard lock(mutex_);
  const auto found = sockets_.find(socket);
  if (found == sockets_.end()) return Room::free;
  OfSocket& of = found->second;
  if (of.due + of.sent.size() >= kMaximumUntakenAnswers) syncLookAt(*socket, of);
  if (of.due + of.sent.size() < kMaximumUntakenAnswers) return Room::free;
  return of.sent.size() > kUnseenMessages ? Room::waitsForPeer : Room::waitsForAnswers;
}

bool UntakenDescriptors::isEmpty() {
  const std::lock_guard lock(mutex_);
  syncLookAtAll();
  return sockets_.empty();
}

void UntakenDescriptors::syncLookAt(const UniqueDescriptor& socket, OfSocket& of) {
  int held = 0;
  if (::ioctl(socket.get(), SIOCOUTQ, &held) != 0) return;
  const std::size_t most = static_cast<std::size_t>(held) / kLightestMessage;
  while (of.sent.size() > most) {
    count_ -= of.sent.front();
    of.sent.pop_front();
  }
}

void UntakenDescriptors::syncLookAtAll() {
  for (auto& [socket, of] : sockets_) syncLookAt(*socket, of);
  std::erase_if(sockets_, [](const auto& each) { return each.second.due == 0 && each.second.sent.empty(); });
}

}  // namespace docuvend::linux_platform
