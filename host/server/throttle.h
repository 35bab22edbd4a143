// The request rate of one client: at most `rate` requests a second, in bursts of up to a second's
// worth. A client that asks faster is made to wait; nothing it sends is dropped, since what comes
// meanwhile waits in its connection.
#pragma once

#include <algorithm>
#include <chrono>
#include <thread>

#include "platform/net.h"

namespace client3::host {

class Throttle {
public:
  explicit Throttle(int rate) : rate_(rate), credit_(rate), last_(platform::Clock::now()) {}

  // Returns when the next request may run.
  void Wait() {
    if (rate_ <= 0) return;
    auto now = platform::Clock::now();
    credit_ = std::min<double>(rate_, credit_ + rate_ * std::chrono::duration<double>(now - last_).count());
    last_ = now;
    if (credit_ < 1) {
      auto wait = std::chrono::duration_cast<platform::Clock::duration>(std::chrono::duration<double>((1 - credit_) / rate_));
      std::this_thread::sleep_for(wait);
      last_ += wait;
      credit_ = 1;
    }
    credit_ -= 1;
  }

private:
  int rate_;
  double credit_;
  platform::Clock::time_point last_;
};

}  // namespace client3::host
