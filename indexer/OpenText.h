#pragma once

#include <future>
#include <memory>
#include <utility>

#include "modification/TALSpellCorrection.h"
#include "modification/TALTopKVocab.h"
#include "platform/Mutex.h"
#include "salt/Index.h"

// An open text index and what reads it: they come and go together. Any number of threads may use
// it at once.
struct OpenText {
  explicit OpenText(std::unique_ptr<salt::Index> opened) : index(std::move(opened)) {}
  ~OpenText() {
    if (vocab != nullptr) vocab->shutdown();  // others may still hold it
  }
  OpenText(const OpenText&) = delete;
  OpenText& operator=(const OpenText&) = delete;

  const std::unique_ptr<salt::Index> index;  // never null
  std::shared_ptr<TALTopKVocab> vocab;       // null without document store
  std::unique_ptr<TALSpellCorrection> spelling;
};

// Hands out the open text index of a class. Any thread.
class OpenTextHolder {
 public:
  // Null while there is none. It stays open as long as the result lives, so that who asks must not
  // be one whom `close` is waiting for by other means.
  [[nodiscard]] std::shared_ptr<OpenText> get() const TL_EXCLUDES(_mutex) {
    platform::MutexLock lock(_mutex);
    return _text;
  }

  // Only while there is none.
  void open(std::unique_ptr<OpenText> text) TL_EXCLUDES(_mutex) {
    std::promise<void> gone;
    platform::MutexLock lock(_mutex);
    _gone = gone.get_future();
    _text = {text.release(), [gone = std::make_shared<std::promise<void>>(std::move(gone))](
                                 const OpenText* unused) {
               delete unused;
               gone->set_value();
             }};
  }

  // Hands out no more, and returns once all who use it have let go and it is closed: the same
  // directory can be opened again. Does nothing while there is none.
  void close() TL_EXCLUDES(_mutex) {
    std::future<void> gone;
    std::shared_ptr<OpenText> text;
    {
      platform::MutexLock lock(_mutex);
      gone = std::move(_gone);
      text = std::exchange(_text, nullptr);
    }
    if (text == nullptr) return;
    text.reset();
    gone.wait();
  }

 private:
  mutable platform::Mutex _mutex;
  std::shared_ptr<OpenText> _text TL_GUARDED_BY(_mutex);
  std::future<void> _gone TL_GUARDED_BY(_mutex);
};
