#pragma once

#include <systemd/sd-bus.h>

#include <map>
#include <memory>
#include <string>
#include <vector>

namespace testsupport {

using Texts = std::vector<std::string>;

// Calls tallow-desktop as GNOME's shell does. One thread.
class SearchClient {
 public:
  explicit SearchClient(const std::string& busAddress);
  ~SearchClient();
  SearchClient(const SearchClient&) = delete;
  SearchClient& operator=(const SearchClient&) = delete;

  // The identifiers of the results.
  [[nodiscard]] Texts search(const Texts& words);
  // What is shown of the results, for each its texts by key.
  [[nodiscard]] std::vector<std::map<std::string, std::string>> metas(const Texts& identifiers);
  void activate(const std::string& identifier);

  // Sends a search without waiting for its answer, which `answerOf` waits for. Searches are
  // numbered from 0.
  void begin(const Texts& words);
  [[nodiscard]] Texts answerOf(size_t number);

 private:
  struct Pending {
    bool answered = false;
    Texts identifiers;
  };
  static int onAnswer(sd_bus_message* reply, void* pending, sd_bus_error*);
  sd_bus_message* newCall(const char* member);
  sd_bus_message* callAndWait(sd_bus_message* call);

  sd_bus* _bus;
  std::vector<std::unique_ptr<Pending>> _pending;
};

}  // namespace testsupport
