#pragma once

#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <string>
#include <vector>

namespace orvanta::bench {

// The CPU time that all threads of a process have used so far, in microseconds. Pid 0 is the calling process.
double cpuMicroseconds(pid_t pid = 0);

// Wall and CPU time of a stretch of work, of this process or another one.
class Stretch {
 public:
  explicit Stretch(pid_t pid = 0) : _pid(pid), _cpu(cpuMicroseconds(pid)), _begun(std::chrono::steady_clock::now()) {}
  double wallMicroseconds() const {
    return std::chrono::duration<double, std::micro>(std::chrono::steady_clock::now() - _begun).count();
  }
  double cpu() const { return cpuMicroseconds(_pid) - _cpu; }

 private:
  const pid_t _pid;
  const double _cpu;
  const std::chrono::steady_clock::time_point _begun;
};

// The result of one measurement, per event.
struct Figure {
  double perSecond = 0;
  double cpuPerEvent = 0;  // microseconds
};
Figure figureOf(const Stretch& stretch, std::uint64_t events);

double median(std::vector<double> values);
double percentile(std::vector<double> values, double share);

// The lines of the table: a figure, or its ratio to the raw limit measured in the same run, with the goal.
void printHeading(const std::string& title);
void printFigure(const std::string& name, const Figure& figure);
void printRatio(const std::string& name, double value, double rawLimit, double goal);

// Runs `once`, which returns how many events it made, until at least `seconds` have passed.
template <class Once>
Figure measure(double seconds, Once once) {
  const Stretch stretch;
  std::uint64_t events = 0;
  do {
    events += once();
  } while (stretch.wallMicroseconds() < seconds * 1e6);
  return figureOf(stretch, events);
}

}  // namespace orvanta::bench
