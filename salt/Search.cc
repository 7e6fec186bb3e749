#include "salt/Search.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <iterator>
#include <optional>
#include <string_view>
#include <utility>

#include "salt/Contenders.h"
#include "salt/DocSet.h"
#include "salt/TermMatches.h"
#include "salt/TermRules.h"

namespace saltsearch {

namespace {

// How many tokens one scan looks for.
constexpr size_t kMaxTokensTogether = 8;
// The matches of so many tokens are held at a time, a bit for each document and zone. The terms of
// a longer query are evaluated one after another, the first of the required ones before the others.
constexpr size_t kMaxTokensHeld = 32;

bool ranksAbove(const DocResult& left, const DocResult& right) {
  return left.score > right.score || (left.score == right.score && left.docID > right.docID);
}

// The documents with the highest scores so far.
class TopDocs {
 public:
  explicit TopDocs(size_t maxResults) : _maxResults(maxResults) {}

  [[nodiscard]] bool full() const { return _heap.size() == _maxResults; }
  // The lowest score; must not be empty.
  [[nodiscard]] double lowest() const { return _heap.front().score; }

  // Whether no document with this score can be added.
  [[nodiscard]] bool refuses(double score) const {
    return full() && (_heap.empty() || score < lowest());
  }

  void add(uint32_t docID, double score) {
    DocResult doc;
    doc.docID = docID;
    doc.score = score;
    if (full()) {
      if (_heap.empty() || !ranksAbove(doc, _heap.front())) return;
      std::pop_heap(_heap.begin(), _heap.end(), ranksAbove);
      _heap.back() = doc;
    } else {
      _heap.push_back(doc);
    }
    std::push_heap(_heap.begin(), _heap.end(), ranksAbove);
  }

  // Sorted.
  std::vector<DocResult> take() {
    std::sort_heap(_heap.begin(), _heap.end(), ranksAbove);
    return std::move(_heap);
  }

 private:
  const size_t _maxResults;
  std::vector<DocResult> _heap;
};

// One search. Required terms are scanned first: only documents that match all of them can be
// results.
class Searching {
 public:
  Searching(const salt::Index& index, std::vector<Term>& terms, const Options& options)
      : _index(index),
        _terms(terms),
        _options(options),
        _evaluation(terms, options),
        _top(options.maxResults),
        _found(terms.size()),
        _matches(terms.size()) {}

  std::vector<DocResult> run() {
    size_t tokens = 0;
    for (size_t u = 0; u < _terms.size(); ++u) {
      if (!_evaluation.skips(u)) tokens += _terms[u].tokens.size();
    }
    if (tokens <= kMaxTokensHeld) {
      evaluateTogether();
    } else {
      evaluateOneByOne();
    }
    return _top.take();
  }

 private:
  // Documents of a page that the same tokens match in the same zones.
  struct Group {
    salt::DocPage docs;
    std::array<uint32_t, kMaxTokensHeld> masks;  // by token, over all terms
  };

  void evaluateTogether() {
    matchRequired();
    for (size_t u = 0; u < _terms.size(); ++u) {
      if (_evaluation.skips(u) || _matches[u]) continue;
      if (nobodyIsLeft()) {
        setFound(_index, _terms[u]);
      } else {
        match(u, [](size_t) { return true; });
      }
    }
    if (!nobodyIsLeft()) evaluatePages();
  }

  // From the last page on, since of equal scores the later document counts: once the list is full,
  // an earlier one must score higher.
  void evaluatePages() {
    if (_options.maxResults == 0) return;
    std::optional<Contenders> contenders;
    for (size_t page = pages(); page-- > 0;) {
      salt::DocPage candidates = candidatesOf(page);
      if (!_required.empty() && _top.full()) {
        if (!contenders) contenders.emplace(_evaluation, _terms, _matches);
        if (!contenders->exceed(_top.lowest())) return;
        candidates = contenders->select(page, candidates);
      }
      if (!candidates.empty()) evaluatePage(page, candidates);
    }
  }

  // Documents that the same tokens match in the same zones have the same score, which is computed
  // once for all of them.
  void evaluatePage(size_t page, const salt::DocPage& candidates) {
    group(page, candidates);
    _scores.assign(_groups.size(), {});
    size_t first = 0;  // token of the term
    for (size_t u = 0; u < _terms.size(); ++u) {
      if (_evaluation.skips(u)) continue;
      _evaluation.apply(
          u, [&](size_t token, size_t i) { return _groups[i].masks[first + token]; }, _scores);
      first += _terms[u].tokens.size();
    }
    for (size_t i = 0; i < _scores.size(); ++i) {
      if (!_evaluation.accepts(_scores[i]) || _top.refuses(_scores[i].score)) continue;
      _groups[i].docs.forEach(
          [&](size_t doc) { _top.add(salt::DocSet::docID(page, doc), _scores[i].score); });
    }
  }

  // Divides the candidates into groups by what matches them where.
  void group(size_t page, const salt::DocPage& candidates) {
    _groups.assign(1, {candidates, {}});
    size_t token = 0;
    for (const auto& matches : _matches) {
      if (!matches) continue;
      for (const auto& parts : matches->parts()) {
        for (const TermMatches::Part& part : parts) {
          const salt::DocPage* const docs = part.docs->page(page);
          if (docs != nullptr) divide(*docs, token, part.mask);
        }
        ++token;
      }
    }
  }

  // Notes that the token matches these documents in the zones of the mask.
  void divide(const salt::DocPage& docs, size_t token, uint32_t mask) {
    for (size_t i = 0, count = _groups.size(); i < count; ++i) {
      const salt::DocPage matched = _groups[i].docs & docs;
      if (matched.empty()) continue;
      if (matched == _groups[i].docs) {
        _groups[i].masks[token] |= mask;
        continue;
      }
      _groups[i].docs.erase(matched);
      _groups.push_back(_groups[i]);
      _groups.back().docs = matched;
      _groups.back().masks[token] |= mask;
    }
  }

  void evaluateOneByOne() {
    matchRequired();
    std::vector<Standing> docs;
    for (size_t page = 0; page < pages(); ++page) addStandings(page, candidatesOf(page), &docs);
    salt::DocSet admitted;
    for (size_t u = 0; u < _terms.size(); ++u) {
      if (_evaluation.skips(u)) continue;
      if (!_required.empty() && docs.empty()) {
        setFound(_index, _terms[u]);
        continue;
      }
      match(u, [](size_t) { return true; });
      if (_required.empty()) {
        _matches[u]->forEach([&](uint32_t docID) {
          if (!admitted.contains(docID)) docs.push_back({docID});
          admitted.insert(docID);
        });
      }
      const TermMatches& matches = *_matches[u];
      _evaluation.apply(
          u, [&](size_t token, size_t i) { return matches.mask(token, docs[i].docID); }, docs);
      _matches[u].reset();
    }
    for (const Standing& doc : docs) {
      if (_evaluation.accepts(doc)) _top.add(doc.docID, doc.score);
    }
  }

  // Matches required terms, as many as can be held.
  void matchRequired() {
    size_t tokens = 0;
    for (size_t u = 0; u < _terms.size(); ++u) {
      const size_t more = _terms[u].tokens.size();
      if (_evaluation.skips(u) || !_evaluation.demandsMatch(u)) continue;
      if (tokens + more > kMaxTokensHeld) continue;
      _required.push_back(u);
      tokens += more;
    }
    for (const size_t u : _required) {
      match(u, [this](size_t v) {
        return std::find(_required.begin(), _required.end(), v) != _required.end();
      });
    }
  }

  // Scans for the tokens of term u, unless that was done, and in the same pass for those of later
  // terms that are wanted, as far as they are few.
  template <typename Wanted>
  void match(size_t u, const Wanted& wanted) {
    if (_matches[u]) return;
    if (_found[u].empty()) scanFrom(u, wanted);
    _matches[u].emplace(_index, _terms[u], std::move(_found[u]), _options.maxSuffixes);
    _found[u].clear();
  }

  template <typename Wanted>
  void scanFrom(size_t u, const Wanted& wanted) {
    std::vector<size_t> together{u};
    size_t tokens = _terms[u].tokens.size();
    for (size_t v = u + 1; v < _terms.size() && tokens < kMaxTokensTogether; ++v) {
      const size_t more = _terms[v].tokens.size();
      if (_evaluation.skips(v) || _matches[v] || !_found[v].empty() || !wanted(v) ||
          tokens + more > kMaxTokensTogether) {
        continue;
      }
      together.push_back(v);
      tokens += more;
    }
    std::vector<std::string_view> prefixes;
    for (const size_t v : together) {
      prefixes.insert(prefixes.end(), _terms[v].tokens.begin(), _terms[v].tokens.end());
    }
    auto found = _index.ScanPlaces(prefixes, _options.maxSuffixes);
    auto next = std::make_move_iterator(found.begin());
    for (const size_t v : together) {
      const auto end = next + static_cast<ptrdiff_t>(_terms[v].tokens.size());
      _found[v].assign(next, end);
      next = end;
    }
  }

  // The number of pages with candidates, at most.
  [[nodiscard]] size_t pages() const {
    size_t count = 0;
    for (const auto& matches : _matches) {
      if (matches) count = std::max(count, matches->pages());
    }
    return count;
  }

  // The documents of the page that match all required terms or, without any, at least one term.
  [[nodiscard]] salt::DocPage candidatesOf(size_t page) const {
    salt::DocPage all;
    if (_required.empty()) {
      for (const auto& matches : _matches) {
        if (matches) matches->addPage(page, &all);
      }
      return all;
    }
    for (const size_t u : _required) {
      salt::DocPage one;
      _matches[u]->addPage(page, &one);
      all = u == _required.front() ? one : all & one;
      if (all.empty()) break;
    }
    return all;
  }

  // Whether no document matches all required terms.
  [[nodiscard]] bool nobodyIsLeft() {
    if (_required.empty()) return false;
    if (!_anyCandidate) {
      _anyCandidate = false;
      for (size_t page = _matches[_required.front()]->pages(); page-- > 0 && !*_anyCandidate;) {
        _anyCandidate = !candidatesOf(page).empty();
      }
    }
    return !*_anyCandidate;
  }

  static void addStandings(size_t page, const salt::DocPage& candidates,
                           std::vector<Standing>* docs) {
    candidates.forEach([&](size_t doc) { docs->push_back({salt::DocSet::docID(page, doc)}); });
  }

  const salt::Index& _index;
  std::vector<Term>& _terms;
  const Options& _options;
  const Evaluation _evaluation;
  TopDocs _top;
  std::vector<TermMatches::Found> _found;            // of terms not yet matched
  std::vector<std::optional<TermMatches>> _matches;  // of terms not yet evaluated
  std::vector<size_t> _required;                     // terms matched before the others
  std::optional<bool> _anyCandidate;                 // once known
  std::vector<Group> _groups;                        // of the page that is evaluated
  std::vector<Standing> _scores;                     // of the groups
};

}  // namespace

std::vector<DocResult> Search(const salt::Index& index, std::vector<Term>& terms,
                              const Options& options) {
  return Searching(index, terms, options).run();
}

double ZoneScoreDefault(uint32_t, uint16_t) {
  return 1.0;
}

Term::operator std::string() const {
  std::string text = isMin ? "{MIN " : "{";
  for (size_t i = 0; i < tokens.size(); ++i) {
    if (i > 0) text += " | ";
    text += fmt::format("\"{}\":", tokens[i]);
    if (i < tokenScores.size()) text += fmt::format("{:g}", tokenScores[i]);
  }
  if (!zones.empty()) text += " zones:{";
  for (size_t i = 0; i < zones.size(); ++i) {
    if (i > 0) text += ',';
    text += fmt::format("{}:", zones[i]);
    if (i < zoneScores.size()) text += fmt::format("{:g}", zoneScores[i]);
  }
  if (!zones.empty()) text += '}';
  if (defaultScore > 0) text += fmt::format(" default:{:g}", defaultScore);
  return text + '}';
}

DocResult::operator std::string() const {
  return fmt::format("{}:{:g}", docID, score);
}

}  // namespace saltsearch
