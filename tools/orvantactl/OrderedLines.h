#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <utility>

namespace orvanta::ctl {

// Lines that become ready in any order and come out in the order in which their places were taken. Not thread-safe.
class OrderedLines {
 public:
  // Takes the next place.
  std::uint64_t reserve() {
    _places.emplace_back();
    return _first + _places.size() - 1;
  }
  void fill(std::uint64_t place, std::string line) { _places[place - _first] = std::move(line); }
  // The next line in order, once it is ready.
  std::optional<std::string> take() {
    if (_places.empty() || !_places.front()) return std::nullopt;
    auto line = std::move(_places.front());
    _places.pop_front();
    ++_first;
    return line;
  }
  // Places taken whose lines have not come out.
  std::size_t size() const { return _places.size(); }

 private:
  std::deque<std::optional<std::string>> _places;
  std::uint64_t _first = 0;  // the place of _places.front()
};

}  // namespace orvanta::ctl
