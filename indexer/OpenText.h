#pragma once

#include <future>
#include <memory>
#include <utility>

#include "modification/TALSpellCorrection.h"
#include "modification/TALTopKVocab.h"
#include "platform/Mutex.h"
#include "salt/Index.h"

// An open text index with the objects that read it; opened and closed together. Any number of
// threads may use it at once.
struct OpenText {
  explicit OpenText(std::unique_ptr<salt::Index> opened) : index(std::move(opened)) {}
  ~OpenText() {
    if (vocab != nullptr) vocab->shutdown();  // others may still hold a reference
  }
  OpenText(const OpenText&) = delete;
  OpenText& operator=(const OpenText&) = delete;

  const std::unique_ptr<salt::Index> index;  // never null
  std::shared_ptr<TALTopKVocab> vocab;       // null without document store
  std::unique_ptr<TALSpellCorrection> spelling;
};

// Holds the open text index of a class and gives out references to it. Any thread.
class OpenTextHolder {
 public:
  // A reference to the open index; null if none is open. The index stays open while the reference
  // exists. A thread that `close` waits for in another way must not hold one.
  [[nodiscard]] std::shared_ptr<OpenText> get() const TL_EXCLUDES(_mutex) {
    platform::MutexLock lock(_mutex);
    return _text;
  }

  // Call it only while no index is open.
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

  // Stops giving out references, and returns once all of them have been released and the index is
  // closed: the same directory can then be opened again. Does nothing if no index is open.
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
