#include "cli/StatusPage.h"

#include <fmt/format.h>

#include <algorithm>
#include <chrono>
#include <climits>
#include <cstdlib>
#include <map>

#include "cli/PageParts.h"
#include "cli/Reading.h"
#include "cli/StatusStyle.h"

namespace cli {

namespace {

constexpr size_t kShownFolders = 12;  // the others are folded in
constexpr size_t kMaxFolders = 1000;
constexpr size_t kMaxProblems = 10000;
constexpr size_t kMaxReasons = 50;
constexpr size_t kPathsOfAReason = 100;
constexpr int kMaxMonths = 36;
constexpr int kMinMonths = 12;

std::string sizeOf(int64_t bytes) {
  return sizeText(static_cast<uint64_t>(std::max<int64_t>(bytes, 0)));
}

std::string section(std::string_view title, const std::string& content) {
  return fmt::format("<section>\n<h2>{}</h2>\n{}</section>\n", title, content);
}

std::string card(std::string_view title, const std::string& value, const std::string& note,
                 std::string_view style = "") {
  return fmt::format(
      "<div class=\"card {}\"><span class=\"name\">{}</span><span class=\"value\">{}</span>"
      "<span class=\"note\">{}</span></div>\n",
      style, title, escapedHTML(value), escapedHTML(note));
}

std::string minutesOf(int64_t seconds) {
  std::string text = timeText(seconds).substr(0, 16);
  std::replace(text.begin(), text.end(), 'T', ' ');
  return text;
}

// --- At a glance

// The sums of all folders.
mailsync::FolderCount sumOf(const std::vector<mailsync::FolderCount>& folders) {
  mailsync::FolderCount sum;
  for (const mailsync::FolderCount& folder : folders) {
    sum.messages += folder.messages;
    sum.indexed += folder.indexed;
    sum.waiting += folder.waiting;
    sum.failed += folder.failed;
  }
  return sum;
}

std::string syncCard(const std::optional<int64_t>& last) {
  if (!last) return card("Last sync", "never", "see tallow sync");
  const std::string minutes = minutesOf(*last);
  return card("Last sync", minutes.substr(0, 10), "at " + minutes.substr(11));
}

std::string mailCards(const ClassStatus& status,
                      const std::vector<mailsync::FolderCount>& folders) {
  const mailsync::FolderCount sum = sumOf(folders);
  const auto folderText =
      fmt::format("in {} folder{}", groupedNumber(static_cast<int64_t>(folders.size())),
                  folders.size() == 1 ? "" : "s");
  return card("Messages indexed", groupedNumber(sum.indexed), folderText) +
         card("Waiting", groupedNumber(sum.waiting),
              status.watched ? "watch is at work" : "watch is not at work") +
         card("Failed", groupedNumber(sum.failed), sum.failed > 0 ? "see below" : "all is well",
              sum.failed > 0 ? "bad" : "") +
         syncCard(status.lastSync);
}

std::string cards(const ClassStatus& status, const std::vector<mailsync::FolderCount>& folders) {
  std::string html = status.catalogue ? mailCards(status, folders) : "";
  if (status.disk) {
    html +=
        card("On the disk", sizeText(status.disk->index + status.disk->store),
             sizeText(status.disk->index) + " index, " + sizeText(status.disk->store) + " store");
  }
  if (status.index) {
    html += card("Text", sizeOf(status.index->textBytes),
                 groupedNumber(status.index->stored) + " messages in the index");
  }
  return "<div class=\"cards\">\n" + html + "</div>\n";
}

// --- Mails by month and year

// Months are counted from year 0.
int monthNumber(const std::string& month) {
  return std::atoi(month.substr(0, 4).c_str()) * 12 + std::atoi(month.substr(5).c_str()) - 1;
}

std::string monthName(int number) {
  return fmt::format("{:04}-{:02}", number / 12, number % 12 + 1);
}

// A chart of all numbers from the first to the last.
Chart countChart(const std::string& title, const std::map<int, int64_t>& counts, int first,
                 int last, std::string (*nameOf)(int)) {
  Chart chart{title, "", {}};
  int64_t most = 0;
  for (int number = first; number <= last; ++number) {
    const auto found = counts.find(number);
    const int64_t count = found == counts.end() ? 0 : found->second;
    most = std::max(most, count);
    chart.bars.push_back({nameOf(number), static_cast<double>(count), groupedNumber(count)});
  }
  chart.most = groupedNumber(most);
  return chart;
}

// Mail of the future does not count, so that one wrong date does not hide all others.
std::string monthSection(const std::vector<mailsync::MonthCount>& counts, double now) {
  const int current = monthNumber(timeText(static_cast<int64_t>(now)));
  std::map<int, int64_t> months;
  std::map<int, int64_t> years;
  int64_t others = 0;
  for (const mailsync::MonthCount& count : counts) {
    const int month = count.month.empty() ? INT_MAX : monthNumber(count.month);
    if (month > current) {
      others += count.messages;
      continue;
    }
    months[month] += count.messages;
    years[month / 12] += count.messages;
  }
  if (months.empty()) return "";
  const int last = months.rbegin()->first;
  const int first = std::clamp(months.begin()->first, last - kMaxMonths + 1, last - kMinMonths + 1);
  std::string html = chartHTML(countChart("By month", months, first, last, monthName));
  if (years.size() > 1) {
    html += chartHTML(countChart("By year", years, years.begin()->first, years.rbegin()->first,
                                 [](int year) { return fmt::format("{:04}", year); }));
  }
  html = "<div class=\"charts\">\n" + html + "</div>\n";
  if (others > 0) {
    html += fmt::format("<p class=\"note\">{} more without a usable date.</p>\n",
                        groupedNumber(others));
  }
  return section("Mails over time", html);
}

// --- Mails by folder

std::string folderRow(const mailsync::FolderCount& folder, int64_t most) {
  std::string notes;
  if (folder.waiting > 0) notes += fmt::format(", {} waiting", groupedNumber(folder.waiting));
  if (folder.failed > 0) notes += fmt::format(", {} failed", groupedNumber(folder.failed));
  if (folder.missing) notes += ", not there";
  return fmt::format("<li><span class=\"path\">{}</span><span class=\"count\">{}{}</span>{}</li>\n",
                     escapedHTML(folder.path), groupedNumber(folder.messages), notes,
                     shareHTML({{"bar", static_cast<double>(folder.indexed)},
                                {"wait", static_cast<double>(folder.waiting)},
                                {"fail", static_cast<double>(folder.failed)}},
                               static_cast<double>(most)));
}

std::string folderList(const std::vector<mailsync::FolderCount>& folders, size_t first,
                       size_t last) {
  std::string html = "<ul class=\"folders\">\n";
  for (size_t i = first; i < last; ++i) html += folderRow(folders[i], folders[0].messages);
  return html + "</ul>\n";
}

std::string folderSection(std::vector<mailsync::FolderCount> folders) {
  if (folders.empty()) return "";
  std::stable_sort(folders.begin(), folders.end(),
                   [](const auto& a, const auto& b) { return a.messages > b.messages; });
  const size_t all = folders.size();
  const size_t last = std::min(all, kMaxFolders);
  const size_t open = std::min(all, kShownFolders);
  std::string html = folderList(folders, 0, open);
  if (open < last) {
    html += fmt::format("<details><summary>{} more folders</summary>\n{}</details>\n",
                        groupedNumber(static_cast<int64_t>(all - open)),
                        folderList(folders, open, last));
  }
  return section("Mails by folder", html);
}

// --- History

std::string dayName(int64_t day) {
  return fmt::format("{:04}-{:02}-{:02}", day / 10000, day / 100 % 100, day % 100);
}

std::chrono::sys_days dayOf(int64_t day) {
  return std::chrono::year(static_cast<int>(day / 10000)) /
         std::chrono::month(static_cast<unsigned>(day / 100 % 100)) /
         std::chrono::day(static_cast<unsigned>(day % 100));
}

// The days until the next measurement.
double spanOf(const std::vector<mailsync::Measurement>& days, size_t at) {
  if (at + 1 == days.size()) return 1;
  return static_cast<double>((dayOf(days[at + 1].day) - dayOf(days[at].day)).count());
}

Chart sizeChart(const std::vector<mailsync::Measurement>& days) {
  Chart chart{"Index and store on the disk", "", {}, false};
  int64_t most = 0;
  for (size_t i = 0; i < days.size(); ++i) {
    const int64_t bytes = days[i].indexBytes + days[i].storeBytes;
    most = std::max(most, bytes);
    chart.bars.push_back(
        {dayName(days[i].day), static_cast<double>(bytes), sizeOf(bytes), spanOf(days, i)});
  }
  chart.most = sizeOf(most);
  return chart;
}

Chart messageChart(const std::vector<mailsync::Measurement>& days) {
  Chart chart{"Messages in the index", "", {}, false};
  int64_t most = 0;
  for (size_t i = 0; i < days.size(); ++i) {
    most = std::max(most, days[i].messages);
    chart.bars.push_back({dayName(days[i].day), static_cast<double>(days[i].messages),
                          groupedNumber(days[i].messages), spanOf(days, i)});
  }
  chart.most = groupedNumber(most);
  return chart;
}

std::string millisecondsText(double milliseconds) {
  return milliseconds < 10 ? fmt::format("{:.2f} ms", milliseconds)
                           : fmt::format("{:.0f} ms", milliseconds);
}

// The average of the scans since the measurement before; of all scans if the counters have begun
// anew.
Chart scanChart(const std::vector<mailsync::Measurement>& days) {
  Chart chart{"Average time to look up a prefix", "", {}, false};
  mailsync::Measurement before;
  double most = 0;
  for (size_t i = 0; i < days.size(); before = days[i++]) {
    const bool grown = days[i].scans >= before.scans && days[i].scanSeconds >= before.scanSeconds;
    const int64_t scans = days[i].scans - (grown ? before.scans : 0);
    const double seconds = days[i].scanSeconds - (grown ? before.scanSeconds : 0);
    const double average = scans > 0 ? 1000 * seconds / static_cast<double>(scans) : 0;
    most = std::max(most, average);
    chart.bars.push_back({dayName(days[i].day), average,
                          scans > 0 ? millisecondsText(average) : "no search", spanOf(days, i)});
  }
  chart.most = millisecondsText(most);
  return chart;
}

std::string historySection(const std::vector<mailsync::Measurement>& days) {
  if (days.size() < 2) {
    return section("Over time",
                   "<p class=\"note\">A sync adds one entry a day; charts begin with the "
                   "second.</p>\n");
  }
  return section("Over time", "<div class=\"charts\">\n" + chartHTML(sizeChart(days)) +
                                  chartHTML(messageChart(days)) + chartHTML(scanChart(days)) +
                                  "</div>\n");
}

// --- Index

std::string fact(std::string_view name, const std::string& value) {
  return fmt::format("<div><dt>{}</dt><dd>{}</dd></div>\n", name, escapedHTML(value));
}

std::string indexSection(const IndexStatus& index) {
  std::string facts = fact("Merge", index.merging ? "at work" : "none at present");
  facts += fact("Merges so far",
                fmt::format("{} in {:.0f} s", groupedNumber(index.merges), index.mergeSeconds));
  facts +=
      fact("Waiting for a merge", fmt::format("{} of {} suffixes", groupedNumber(index.hotSuffixes),
                                              groupedNumber(index.suffixes)));
  facts += fact("Deleted, still in the files",
                fmt::format("{} messages, {:.0f} % of the files", groupedNumber(index.deleted),
                            100 * index.deletedShare()));
  const double average =
      index.scans > 0 ? 1000 * index.scanSeconds / static_cast<double>(index.scans) : 0;
  facts += fact("Prefixes looked up",
                fmt::format("{}, {} each", groupedNumber(index.scans), millisecondsText(average)));
  if (index.searchable < index.stored) {
    facts += fact("Stored and not searchable", groupedNumber(index.stored - index.searchable));
  }
  return section("Searches and merges", "<dl>\n" + facts + "</dl>\n");
}

// --- Failures

std::string reasonHTML(const std::string& reason, const std::vector<std::string>& paths) {
  std::string html = fmt::format(
      "<details><summary><span class=\"path\">{}</span> <span class=\"count\">{}</span></summary>\n"
      "<ul class=\"paths\">\n",
      escapedHTML(reason), groupedNumber(static_cast<int64_t>(paths.size())));
  const size_t last = std::min(paths.size(), kPathsOfAReason);
  for (size_t i = 0; i < last; ++i) html += "<li>" + escapedHTML(paths[i]) + "</li>\n";
  if (last < paths.size()) html += fmt::format("<li>and {} more</li>\n", paths.size() - last);
  return html + "</ul></details>\n";
}

std::string failureSection(const std::vector<mailsync::Problem>& problems) {
  if (problems.empty()) return "";
  std::map<std::string, std::vector<std::string>> byReason;
  for (const mailsync::Problem& problem : problems) {
    const bool room = byReason.size() < kMaxReasons || byReason.contains(problem.reason);
    byReason[room ? problem.reason : "other reasons"].push_back(problem.path);
  }
  std::string html;
  for (const auto& [reason, paths] : byReason) html += reasonHTML(reason, paths);
  return section("Failures", html);
}

// --- The page

std::string classHTML(const ClassStatus& status, bool named, double now) {
  std::vector<mailsync::FolderCount> folders;
  if (status.catalogue) folders = status.catalogue->folderCounts();
  std::string html = named ? "<h1>" + escapedHTML(status.name) + "</h1>\n" : "";
  html += cards(status, folders);
  if (status.error) html += "<p class=\"error\">" + escapedHTML(status.error->message) + "</p>\n";
  if (!status.catalogue) {
    html += "<p class=\"note\">No mailbox is kept in step; see tallow sync.</p>\n";
  } else {
    html += monthSection(status.catalogue->monthCounts(), now) + folderSection(std::move(folders)) +
            failureSection(status.catalogue->problems(kMaxProblems)) +
            historySection(status.catalogue->measurements());
  }
  if (status.index) html += indexSection(*status.index);
  return "<div class=\"class\">\n" + html + "</div>\n";
}

}  // namespace

std::string statusPage(const std::vector<ClassStatus>& classes, const std::string& lock,
                       double now) {
  std::string body = fmt::format(
      "<header><strong>tallow</strong><span>{}</span><span class=\"pill\">device {}</span>"
      "</header>\n",
      minutesOf(static_cast<int64_t>(now)), escapedHTML(lock));
  for (const ClassStatus& status : classes) body += classHTML(status, classes.size() > 1, now);
  return pageHTML("Mail index", kStatusStyle, body);
}

}  // namespace cli
