#include "platform/zyn/StrandQueue.h"

#include <asio/dispatch.hpp>
#include <asio/post.hpp>

#include "platform/zyn/Runtime.h"

namespace zyn {

StrandQueue::StrandQueue(std::string label)
    : label_(std::move(label)), strand_(Runtime::shared().context()) {}

StrandQueue::StrandQueue(std::string label, std::shared_ptr<EventLoop> loop)
    : label_(std::move(label)), loop_(std::move(loop)), strand_(loop_->context()) {}

void StrandQueue::async(Work work) {
  asio::post(strand_, std::move(work));
}

void StrandQueue::dispatch(Work work) {
  asio::dispatch(strand_, std::move(work));
}

}  // namespace zyn
