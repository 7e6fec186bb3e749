#pragma once

#include <string>
#include <vector>

#include "client/SearchServiceProxy.h"

namespace testsupport {

[[nodiscard]] client::EncodedItem mail(const std::string& identifier, const std::string& subject,
                                       const std::string& body = "");

// Mails "PREFIX0" and so on, with the subject "word PREFIX" and 300 words each.
[[nodiscard]] std::vector<client::EncodedItem> mails(const std::string& prefix, int count);

// The number of results, or the code of the error.
int64_t search(client::SearchServiceProxy& service, const std::string& text,
               const std::string& protectionClass = "default");

}  // namespace testsupport
