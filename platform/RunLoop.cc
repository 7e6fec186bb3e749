#include "platform/RunLoop.h"

#include <pthread.h>
#include <signal.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <systemd/sd-event.h>
#include <unistd.h>

#include <utility>
#include <vector>

#include "platform/Mutex.h"

namespace platform {

void takeSignalFromProcess(int signal) {
  sigset_t set;
  sigemptyset(&set);
  sigaddset(&set, signal);
  pthread_sigmask(SIG_BLOCK, &set, nullptr);
}

namespace {

class EventSource : public RunLoop::Socket {
 public:
  ~EventSource() override { sd_event_source_disable_unref(_source); }

  void setReading(bool reading) override {
    sd_event_source_set_io_events(_source, reading ? uint32_t{EPOLLIN} : 0);
  }

  std::function<void(int)> handler;
  sd_event_source* _source = nullptr;
};

int onSignal(sd_event_source*, const signalfd_siginfo* info, void* data) {
  static_cast<EventSource*>(data)->handler(static_cast<int>(info->ssi_signo));
  return 0;
}

int onReadable(sd_event_source*, int descriptor, uint32_t, void* data) {
  static_cast<EventSource*>(data)->handler(descriptor);
  return 0;
}

int onSocket(sd_event_source*, int, uint32_t events, void* data) {
  static_cast<EventSource*>(data)->handler((events & (EPOLLHUP | EPOLLERR)) != 0 ? 1 : 0);
  return 0;
}

int onTimer(sd_event_source*, uint64_t, void* data) {
  static_cast<EventSource*>(data)->handler(0);
  return 0;
}

}  // namespace

struct RunLoop::Body {
  sd_event* event = nullptr;
  int wake = -1;
  std::unique_ptr<Source> wakeSource;
  Mutex mutex;
  std::vector<std::function<void()>> items TL_GUARDED_BY(mutex);
  bool stopping TL_GUARDED_BY(mutex) = false;

  void signalWake() const {
    const uint64_t one = 1;
    [[maybe_unused]] const ssize_t n = write(wake, &one, sizeof one);
  }

  void runItems() {
    uint64_t count;
    [[maybe_unused]] const ssize_t n = read(wake, &count, sizeof count);
    std::vector<std::function<void()>> batch;
    bool ending;
    {
      MutexLock lock(mutex);
      batch.swap(items);
      ending = stopping;
    }
    for (const auto& item : batch) item();
    if (ending) sd_event_exit(event, 0);
  }
};

RunLoop::RunLoop() : _body(std::make_unique<Body>()) {
  if (sd_event_new(&_body->event) < 0) return;
  _body->wake = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
  if (_body->wake < 0) return;
  _body->wakeSource = addReadable(_body->wake, [body = _body.get()] { body->runItems(); });
}

RunLoop::~RunLoop() {
  _body->wakeSource.reset();
  if (_body->wake >= 0) close(_body->wake);
  sd_event_unref(_body->event);
}

bool RunLoop::good() const {
  return _body->wakeSource != nullptr;
}

std::unique_ptr<RunLoop::Source> RunLoop::addSignal(int signal, std::function<void(int)> handler) {
  auto source = std::make_unique<EventSource>();
  source->handler = std::move(handler);
  if (sd_event_add_signal(_body->event, &source->_source, signal, onSignal, source.get()) < 0) {
    return nullptr;
  }
  return source;
}

std::unique_ptr<RunLoop::Source> RunLoop::addReadable(int descriptor,
                                                      std::function<void()> handler) {
  auto source = std::make_unique<EventSource>();
  source->handler = [handler = std::move(handler)](int) { handler(); };
  if (sd_event_add_io(_body->event, &source->_source, descriptor, EPOLLIN, onReadable,
                      source.get()) < 0) {
    return nullptr;
  }
  return source;
}

std::unique_ptr<RunLoop::Socket> RunLoop::addSocket(int descriptor,
                                                    std::function<void(bool)> handler) {
  auto source = std::make_unique<EventSource>();
  source->handler = [handler = std::move(handler)](int peerGone) { handler(peerGone != 0); };
  if (sd_event_add_io(_body->event, &source->_source, descriptor, EPOLLIN, onSocket, source.get()) <
      0) {
    return nullptr;
  }
  return source;
}

std::unique_ptr<RunLoop::Source> RunLoop::addTimer(uint64_t milliseconds,
                                                   std::function<void()> handler) {
  auto source = std::make_unique<EventSource>();
  source->handler = [handler = std::move(handler)](int) { handler(); };
  if (sd_event_add_time_relative(_body->event, &source->_source, CLOCK_MONOTONIC,
                                 milliseconds * 1000, 0, onTimer, source.get()) < 0) {
    return nullptr;
  }
  return source;
}

void RunLoop::post(std::function<void()> item) {
  {
    MutexLock lock(_body->mutex);
    _body->items.push_back(std::move(item));
  }
  _body->signalWake();
}

void RunLoop::run() {
  sd_event_loop(_body->event);
}

void RunLoop::stop() {
  {
    MutexLock lock(_body->mutex);
    _body->stopping = true;
  }
  _body->signalWake();
}

sd_event* RunLoop::event() const {
  return _body->event;
}

RunLoop& mainRunLoop() {
  static auto* loop = new RunLoop;
  return *loop;
}

}  // namespace platform
