// What a provider may try to use up.
#pragma once

#include <string>

namespace docuvend::tests {

// Allocates until it is refused. Does not touch what it gets: the limit counts what is asked for.
[[noreturn]] void allocateWithoutEnd();
// Makes children, which wait for ever, until it is refused; how many there are.
int forkWithoutEnd();
// Leaves thousands of descriptors in sockets of its own, as far as the kernel passes them on for this process; how many there are.
int hoardDescriptors();
// Writes this many lines to the standard error output.
void chatter(int lines);
// In place of serving: sends requests to the socket, some with descriptors, and takes no answer. Ends with the connection.
void floodWithFrames(int socket);

}  // namespace docuvend::tests
