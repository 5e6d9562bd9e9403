#include "platform/zyn/EventLoop.h"

#include <pthread.h>

#include <thread>

#include "platform/zyn/Runtime.h"

namespace zyn {

EventLoop::EventLoop(const std::string& threadName)
    : context_(std::make_shared<asio::io_context>(1)), guard_(asio::make_work_guard(*context_)) {
  // The shared runtime makes the statics an I/O thread needs until exit; make them first.
  static_cast<void>(Runtime::shared());
  std::thread([context = context_, name = threadName.substr(0, 15)] {
    pthread_setname_np(pthread_self(), name.c_str());
    context->run();
  }).detach();
}

EventLoop::~EventLoop() {
  guard_.reset();
}

}  // namespace zyn
