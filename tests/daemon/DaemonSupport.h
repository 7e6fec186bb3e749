#pragma once

#include <optional>
#include <set>
#include <string>
#include <vector>

#include "client/SearchServiceProxy.h"

namespace testsupport {

[[nodiscard]] client::EncodedItem mail(const std::string& identifier, const std::string& subject,
                                       const std::string& body = "");

// Mails "PREFIX0" and so on, with the subject "word PREFIX" and 300 words each.
[[nodiscard]] std::vector<client::EncodedItem> mails(const std::string& prefix, int count);

// The identifiers of all results.
std::optional<std::multiset<std::string>> found(client::SearchServiceProxy& service,
                                                const std::string& text,
                                                const std::string& protectionClass,
                                                TLErrorOut error);

// The value that `part` (0 to 1) of all values do not exceed; 0 without values.
double percentile(std::vector<double> values, double part);

// The number of results, or the code of the error.
int64_t search(client::SearchServiceProxy& service, const std::string& text,
               const std::string& protectionClass = "default");

}  // namespace testsupport
