#include "platform/zyn/ThreadQueue.h"

#include <pthread.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <asio/post.hpp>

namespace zyn {

ThreadQueue::ThreadQueue(std::string label, int niceness) : label_(std::move(label)), pool_(1) {
  asio::post(pool_, [name = label_.substr(0, 15), niceness] {
    pthread_setname_np(pthread_self(), name.c_str());
    if (niceness < 0) setpriority(PRIO_PROCESS, static_cast<id_t>(syscall(SYS_gettid)), niceness);
  });
}

ThreadQueue::~ThreadQueue() {
  pool_.join();
}

void ThreadQueue::async(Work work) {
  asio::post(pool_, std::move(work));
}

bool ThreadQueue::isCurrent() const {
  return pool_.get_executor().running_in_this_thread();
}

}  // namespace zyn
