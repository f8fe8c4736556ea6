// How much of what is sent a socket holds until the peer takes it. Not guarded: the owner does that.
#pragma once

namespace docuvend::linux_platform {

class SendBuffer {
 public:
  // As little as the system lets it be: the socket then becomes writable when next to nothing is left for the peer to take.
  void narrow(int socket);
  // What it was before.
  void widen(int socket);

 private:
  int usual_ = 0;  // 0: it is so
};

}  // namespace docuvend::linux_platform
