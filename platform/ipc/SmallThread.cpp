#include "platform/ipc/SmallThread.h"

#include <memory>
#include <system_error>
#include <utility>

namespace vesk {

namespace {

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define VESK_LARGE_FRAMES 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(thread_sanitizer)
#define VESK_LARGE_FRAMES 1
#endif
#endif

// A value nested to the limit, decoded and written as JSON, takes about 100 KiB.
#ifdef VESK_LARGE_FRAMES
constexpr std::size_t kStackSize = std::size_t{4} << 20;
#else
constexpr std::size_t kStackSize = std::size_t{512} << 10;
#endif

struct Start {
  const char* name;
  std::function<void()> body;
};

void* run(void* argument) {
  std::unique_ptr<Start> start(static_cast<Start*>(argument));
  pthread_setname_np(pthread_self(), start->name);
  start->body();
  return nullptr;
}

class Attributes {
 public:
  Attributes() {
    if (int error = pthread_attr_init(&_attributes)) fail(error);
    pthread_attr_setstacksize(&_attributes, kStackSize);
  }
  ~Attributes() { pthread_attr_destroy(&_attributes); }
  const pthread_attr_t* get() const { return &_attributes; }
  [[noreturn]] static void fail(int error) {
    throw std::system_error(error, std::generic_category(), "A thread can't be started");
  }

 private:
  pthread_attr_t _attributes;
};

}  // namespace

SmallThread::SmallThread(const char* name, std::function<void()> body) {
  auto start = std::make_unique<Start>(Start{name, std::move(body)});
  Attributes attributes;
  if (int error = pthread_create(&_thread, attributes.get(), run, start.get())) Attributes::fail(error);
  _joinable = true;
  static_cast<void>(start.release());
}

SmallThread::SmallThread(SmallThread&& other) noexcept
    : _thread(other._thread), _joinable(std::exchange(other._joinable, false)) {}

SmallThread& SmallThread::operator=(SmallThread&& other) noexcept {
  if (this != &other) {
    join();
    _thread = other._thread;
    _joinable = std::exchange(other._joinable, false);
  }
  return *this;
}

void SmallThread::join() noexcept {
  if (std::exchange(_joinable, false)) pthread_join(_thread, nullptr);
}

}  // namespace vesk
