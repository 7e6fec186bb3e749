#include "cli/SetupDialog.h"

#include <fmt/format.h>

#include <charconv>
#include <cstdio>
#include <iostream>
#include <set>

#include "cli/Commands.h"
#include "cli/Terminal.h"

namespace cli {

namespace {

constexpr int kMaxAnswers = 3;
constexpr std::string_view kBetween = " ,\t\r";

std::vector<std::string_view> wordsOf(std::string_view text) {
  std::vector<std::string_view> words;
  for (size_t at = text.find_first_not_of(kBetween); at != std::string_view::npos;) {
    const size_t end = text.find_first_of(kBetween, at);
    words.push_back(text.substr(at, end - at));
    at = text.find_first_not_of(kBetween, std::min(end, text.size()));
  }
  return words;
}

std::optional<size_t> indexOf(std::string_view word, size_t count) {
  size_t number = 0;
  const auto [end, failure] = std::from_chars(word.data(), word.data() + word.size(), number);
  if (failure != std::errc() || end != word.data() + word.size()) return std::nullopt;
  if (number < 1 || number > count) return std::nullopt;
  return number - 1;
}

std::vector<size_t> allOf(size_t count) {
  std::vector<size_t> all(count);
  for (size_t i = 0; i < count; ++i) all[i] = i;
  return all;
}

}  // namespace

std::string placesText(const std::vector<MailPlace>& places) {
  std::string text;
  for (size_t i = 0; i < places.size(); ++i) {
    text += fmt::format("  {}  {}: {}\n", i + 1, cleanForTerminal(places[i].path),
                        countText(places[i].count));
  }
  return text;
}

std::optional<std::vector<size_t>> parseChoice(std::string_view answer, size_t count,
                                               bool allByDefault) {
  const auto words = wordsOf(answer);
  const std::string_view first = words.empty() ? (allByDefault ? "all" : "none") : words[0];
  if (words.size() <= 1 && (first == "all" || first == "a")) return allOf(count);
  if (words.size() <= 1 && (first == "none" || first == "n")) return std::vector<size_t>();
  std::set<size_t> chosen;
  for (const std::string_view word : words) {
    const auto index = indexOf(word, count);
    if (!index) return std::nullopt;
    chosen.insert(*index);
  }
  return std::vector<size_t>(chosen.begin(), chosen.end());
}

std::optional<std::vector<std::string>> askWhich(const std::vector<MailPlace>& places,
                                                 bool allByDefault) {
  for (int i = 0; i < kMaxAnswers; ++i) {
    fmt::print(stderr, "Which of them? Numbers such as \"1 3\", \"all\" or \"none\" [{}] ",
               allByDefault ? "all" : "none");
    std::string answer;
    if (!std::getline(std::cin, answer)) return std::nullopt;
    const auto chosen = parseChoice(answer, places.size(), allByDefault);
    if (!chosen) continue;
    std::vector<std::string> paths;
    for (const size_t index : *chosen) paths.push_back(places[index].path);
    return paths;
  }
  return std::nullopt;
}

}  // namespace cli
