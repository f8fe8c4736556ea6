#include "tests/system/turntaker/HangMeasure.h"

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <fstream>
#include <future>
#include <thread>
#include <utility>

namespace docuvend::turntaker {
namespace {

using Clock = std::chrono::steady_clock;

constexpr auto kPatience = std::chrono::seconds(60);
constexpr auto kBetweenLooks = std::chrono::milliseconds(1);

Failure readOnce(Consumer& consumer, const QXURL& url) {
  auto turn = consumer.coordinateReading(url);
  if (auto* error = std::get_if<QXError>(&turn)) return *error;
  return std::get<CoordinatedAccess>(turn).end();
}

Failure timeRead(Consumer& consumer, const QXURL& url, std::vector<double>& times) {
  const auto begin = Clock::now();
  auto failure = readOnce(consumer, url);
  times.push_back(std::chrono::duration<double, std::micro>(Clock::now() - begin).count());
  return failure;
}

Failure awaitProvider(Consumer& consumer, const QXURL& url) {
  for (const auto deadline = Clock::now() + kPatience; Clock::now() < deadline; std::this_thread::sleep_for(kBetweenLooks)) {
    const auto holders = consumer.holders(url);
    if (const auto* error = std::get_if<QXError>(&holders)) return *error;
    const auto& all = std::get<std::vector<FileHolder>>(holders);
    if (!all.empty() && all.front().state == FileHolder::State::providing) return std::nullopt;
  }
  return QXError::make("TurntakerErrorDomain", 2, "the provider does not hang");
}

Failure round(Consumer& consumer, const HangPlan& plan, HangFigures& figures) {
  if (auto failure = timeRead(consumer, plan.healthy, figures.without)) return failure;
  std::remove(plan.free.c_str());
  auto waiting = std::async(std::launch::async, [&consumer, &plan] { return readOnce(consumer, plan.hanging); });
  auto failure = awaitProvider(consumer, plan.hanging);
  if (!failure) failure = timeRead(consumer, plan.healthy, figures.with);
  std::ofstream(plan.free).close();
  auto ofWaiting = waiting.get();
  return failure ? failure : ofWaiting;
}

}  // namespace

Result<HangFigures> measureHang(Consumer& consumer, const HangPlan& plan) {
  HangFigures figures;
  // What is brought once, and what is started once, is not measured.
  if (auto failure = readOnce(consumer, plan.healthy)) return *failure;
  for (std::size_t i = 0; i < plan.rounds; ++i) {
    if (auto failure = round(consumer, plan, figures)) return *failure;
  }
  std::sort(figures.without.begin(), figures.without.end());
  std::sort(figures.with.begin(), figures.with.end());
  return figures;
}

}  // namespace docuvend::turntaker
