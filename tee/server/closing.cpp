#include "tee/server/closing.h"

#include <pthread.h>

#include <cerrno>
#include <chrono>
#include <csignal>
#include <system_error>
#include <utility>

namespace hosted_tee {
namespace {

// Nobody sends it to a process without sockets that ask for it, and unheard it does nothing.
constexpr int nudge_signal = SIGURG;

constexpr auto between_nudges = std::chrono::milliseconds(1);

}  // namespace

void prepare_nudges() {
  struct sigaction action {};
  action.sa_handler = [](int) {};
  action.sa_flags = SA_RESTART;
  if (::sigaction(nudge_signal, &action, nullptr) != 0) {
    throw std::system_error(errno, std::generic_category(), "sigaction");
  }
  // Whoever started this process may have blocked all signals. Threads have the mask of those that make them.
  sigset_t nudges;
  ::sigemptyset(&nudges);
  ::sigaddset(&nudges, nudge_signal);
  if (const int error = ::pthread_sigmask(SIG_UNBLOCK, &nudges, nullptr); error != 0) {
    throw std::system_error(error, std::generic_category(), "pthread_sigmask");
  }
}

void nudge(std::thread& thread) {
  (void)::pthread_kill(thread.native_handle(), nudge_signal);
}

closer::closer() {
  prepare_nudges();
  waiting_.reserve(most_waiting + 1);
  thread_ = std::thread([this] { work(); });
}

closer::~closer() {
  std::unique_lock lock(mutex_);
  is_ending_ = true;
  has_come_.notify_one();
  while (!has_gone_.wait_for(lock, between_nudges, [this] { return has_ended_; })) nudge(thread_);
  lock.unlock();
  thread_.join();
}

void closer::take_over(file_descriptor descriptor) {
  std::unique_lock lock(mutex_);
  waiting_.push_back(std::move(descriptor));
  has_come_.notify_one();
  while (!has_gone_.wait_for(lock, between_nudges, [this] { return waiting_.size() <= most_waiting; })) nudge(thread_);
}

bool closer::hurry() {
  const std::scoped_lock lock(mutex_);
  if (waiting_.empty()) return false;
  nudge(thread_);
  return true;
}

void closer::work() {
  std::unique_lock lock(mutex_);
  for (;;) {
    has_come_.wait(lock, [this] { return is_ending_ || !waiting_.empty(); });
    if (waiting_.empty()) break;
    file_descriptor next = std::move(waiting_.front());
    waiting_.erase(waiting_.begin());
    lock.unlock();
    next = {};
    lock.lock();
    has_gone_.notify_one();
  }
  has_ended_ = true;
  has_gone_.notify_one();
}

}  // namespace hosted_tee
