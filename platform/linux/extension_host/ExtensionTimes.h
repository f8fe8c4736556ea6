// How long things about an extension's process may take, and when they happen.
#pragma once

#include <chrono>

namespace docuvend::linux_platform {

struct ExtensionTimes {
  using Duration = std::chrono::milliseconds;

  // A process without requests is kept this long for the next one.
  Duration linger{30'000};
  // An answer that must be quick (initial setup, identifier, URL, a sign of life) and takes longer, in its turn, ends the process.
  Duration answerLimit{10'000};
  // A process of which something is expected is asked for a sign of life this often.
  Duration livenessInterval{10'000};
  // After its connection was closed, a process has this long to end by itself, and again after it was asked to by signal.
  Duration endGrace{2'000};
  // One whose bundle was updated, by installing another over it or in its directory, may end what it is about for so long: nobody who is
  // reading is to notice an update. It reaches nothing that the new one does not. But it runs what is not installed any more, which may be
  // another maker's, and a message that it never answers would keep it for good. What is removed is ended at once.
  Duration updateGrace{10'000};
  // A process that is gone sooner than this after its start died quickly.
  Duration quickDeath{5'000};
  // After the second quick death in a row no process is started for the first of these; each further one doubles it, up to the second.
  Duration firstBackOff{1'000};
  Duration longestBackOff{60'000};
};

}  // namespace docuvend::linux_platform
