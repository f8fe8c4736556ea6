#include "tests/cellar/BeforeExchange.h"

#include <stdio.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <utility>

namespace docuvend::cellar {
namespace {

BeforeExchange* current = nullptr;

}  // namespace

BeforeExchange::BeforeExchange(std::vector<std::function<void()>> actions) : actions_(std::move(actions)) { current = this; }

BeforeExchange::~BeforeExchange() { current = nullptr; }

void BeforeExchange::exchangeComes() {
  const std::size_t number = count_++;
  if (number < actions_.size()) actions_[number]();
}

}  // namespace docuvend::cellar

// Stands before the C library's function of that name for the whole program.
extern "C" int renameat2(int fromDirectory, const char* from, int toDirectory, const char* to, unsigned flags) noexcept {
  if (docuvend::cellar::current != nullptr && (flags & RENAME_EXCHANGE) != 0) docuvend::cellar::current->exchangeComes();
  return static_cast<int>(syscall(SYS_renameat2, fromDirectory, from, toDirectory, to, flags));
}
