// A confined application that holds a document while something happens, and then says what it can still do with it.
//
//   tenant STRING PROVIDER
//
// Prints "holding: ok" and makes the file "holding" in its container when it has the document open for writing; goes on when the file "go"
// lies there. One line for each attempt, "what: outcome"; an outcome is "ok" or the domain and code of an error.
#include <unistd.h>

#include <chrono>
#include <fstream>
#include <iostream>
#include <string>
#include <thread>

#include "sdk/Consumer.h"

namespace docuvend {
namespace {

constexpr auto kPatience = std::chrono::seconds(60);
constexpr auto kBetweenLooks = std::chrono::milliseconds(2);

std::string outcome(const QXError& error) { return error.domain + " " + std::to_string(error.code); }
std::string outcome(const Failure& failure) { return failure ? outcome(*failure) : "ok"; }
template <class T>
std::string outcome(const Result<T>& result) {
  const auto* error = std::get_if<QXError>(&result);
  return error == nullptr ? "ok" : outcome(*error);
}

void say(const std::string& what, const std::string& how) { std::cout << what << ": " << how << std::endl; }

bool waitFor(const char* file) {
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  while (::access(file, F_OK) != 0) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::sleep_for(kBetweenLooks);
  }
  return true;
}

void tryEverything(Consumer& consumer, const Document& document, const ProviderID& provider, const std::string& string,
                   const std::string& when) {
  const ConsumerID self = consumer.ownIdentifier().value_or(ConsumerID{});
  say(when + " redeem", outcome(consumer.redeem(*document.itemToken, Access::readWrite)));
  say(when + " start", outcome(consumer.startProviding(document.url, provider, self)));
  say(when + " extend", outcome(consumer.extendBookmark(document.url, self)));
  say(when + " resolve", outcome(consumer.documentURL(string)));
}

int run(const std::string& string, const ProviderID& provider) {
  auto connected = Consumer::connect({});
  if (const auto* error = std::get_if<QXError>(&connected)) return say("connect", outcome(*error)), 1;
  Consumer& consumer = *std::get<std::unique_ptr<Consumer>>(connected);
  const auto resolved = consumer.documentURL(string);
  if (const auto* error = std::get_if<QXError>(&resolved)) return say("documentURL", outcome(*error)), 1;
  const auto& document = std::get<Document>(resolved);
  const auto opened = consumer.open(document, provider, Access::readWrite);
  if (const auto* error = std::get_if<QXError>(&opened)) return say("open", outcome(*error)), 1;
  tryEverything(consumer, document, provider, string, "before");
  std::ofstream("holding").close();
  say("holding", waitFor("go") ? "ok" : "in vain");
  const std::string text = "still here";
  const auto written = ::pwrite(std::get<QXDescriptor>(opened).number, text.data(), text.size(), 0);
  say("after write", written == static_cast<ssize_t>(text.size()) ? "ok" : "refused");
  tryEverything(consumer, document, provider, string, "after");
  return 0;
}

}  // namespace
}  // namespace docuvend

int main(int count, char** words) { return count == 3 ? docuvend::run(words[1], docuvend::ProviderID{words[2]}) : 2; }
