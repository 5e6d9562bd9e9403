#pragma once

#include <functional>
#include <string>

namespace zyn {

// A serial queue: work items submitted to it run one at a time, in submission order, on a thread
// of the queue's choosing. Implementations are safe to submit to from any thread.
class SerialQueue {
 public:
  using Work = std::function<void()>;

  virtual ~SerialQueue() = default;

  // Schedules |work| and returns at once.
  virtual void async(Work work) = 0;

  // True when the calling thread is running one of this queue's work items.
  virtual bool isCurrent() const = 0;

  virtual const std::string& label() const = 0;
};

}  // namespace zyn
