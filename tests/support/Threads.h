#pragma once

#include <thread>
#include <vector>

namespace orvanta::test {

// Runs `body` with each number below `count` in a thread of its own, and waits for all.
template <class Body>
void inThreads(int count, Body body) {
  std::vector<std::thread> threads;
  for (int number = 0; number < count; ++number) threads.emplace_back([&body, number] { body(number); });
  for (auto& thread : threads) thread.join();
}

}  // namespace orvanta::test
