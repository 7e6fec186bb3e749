#include "daemon/VerificationQuery.h"

#include <algorithm>
#include <unordered_set>

#include "daemon/TALSearchService.h"
#include "platform/Redaction.h"
#include "records/TLParameters.h"

namespace {

constexpr size_t kMinSubjects = 5;
constexpr TLStringView kClause = u"kTLItemSubject = ";
constexpr TLStringView kClauseStart = u"kTLItemSubject = '";
constexpr TLStringView kSeparator = u"' || ";

const platform::Log& log() {
  return TALSearchService::log();
}

bool isSubjectClause(const TLQueryNode& node) {
  return node.mergeOp() == TLQueryNodeMergeOp::LEAF && node.op() == TLQueryNodeOp::STRING_EQUAL &&
         node.keysCount() == 1 &&
         node.keyAtIndex(0) == static_cast<int32_t>(TLAttributeKey::SUBJECT);
}

TLString replaceAll(TLStringView text, TLStringView from, TLStringView to) {
  TLString out;
  out.reserve(text.size());
  for (;;) {
    const size_t at = text.find(from);
    out.append(text.substr(0, at));
    if (at == TLStringView::npos) return out;
    out.append(to);
    text.remove_prefix(at + from.size());
  }
}

// Undoes the escapes, one kind after another, each on the result of the previous step.
TLString _stringFromEscapedString(TLString text) {
  text = replaceAll(text, u"\\\\", u"\\");
  text = replaceAll(text, u"\\\"", u"\"");
  text = replaceAll(text, u"\\'", u"'");
  return replaceAll(text, u"\\*", u"*");
}

TLStringView trim(TLStringView text, TLStringView characters) {
  const size_t first = text.find_first_not_of(characters);
  if (first == TLStringView::npos) return {};
  return text.substr(first, text.find_last_not_of(characters) - first + 1);
}

}  // namespace

bool isMailVerificationQuery(const TLQuery* query) {
  if (query == nullptr || !query->hasRoot()) return false;
  const TLQueryNode& root = *query->root();
  return root.mergeOp() == TLQueryNodeMergeOp::OR && root.childsCount() >= kMinSubjects &&
         std::all_of(root.childs().begin(), root.childs().end(),
                     [](const auto& child) { return isSubjectClause(*child); });
}

TALIndexer::Strings subjectsFromRawQuery(TLStringView rawQuery) {
  TALIndexer::Strings subjects;
  const auto pieces = platform::split(trim(rawQuery, u" ()"), kSeparator);
  for (size_t i = 0; i < pieces.size(); ++i) {
    if (pieces[i].find(kClause) == TLStringView::npos) continue;
    TLString subject = replaceAll(pieces[i], kClauseStart, u"");
    if (i + 1 == pieces.size()) {
      // The last piece still has the closing quote.
      if (subject.size() < 2) continue;
      subject.pop_back();
    }
    subjects.push_back(_stringFromEscapedString(std::move(subject)));
  }
  log().standard("Extracted {} subjects from Verification Query", subjects.size());
  return subjects;
}

std::optional<TALIndexer::Items> handleVerificationQueryWithIndexer(
    TALIndexer& indexer, TLQuery& query, const TALIndexer::Strings& subjects, TLErrorOut error) {
  log().standard("[Verification Query] Starting Search for Verification Query with {} subjects",
                 subjects.size());
  std::unordered_set<TLString> remaining(subjects.begin(), subjects.end());
  std::optional<TLError> failure;
  const TALIndexer::Items results = indexer.search(query, &failure);
  if (failure) {
    platform::setError(error, *failure);
    return std::nullopt;
  }
  const auto maxTopK = static_cast<uint64_t>(query.searchParams()->intValueForKey("salt.maxTopK"));
  if (results.size() >= maxTopK || results.size() < subjects.size()) {
    log().standard(
        "[Verification Query] Query contains {} subjects but search retrieved {} docs (max_limit = "
        "{}), will use a slow linear search for finding the subjects",
        subjects.size(), results.size(), maxTopK);
    return indexer.iterateAllDocsToFindMatchingSubjects(subjects, error);
  }
  std::unordered_set<TLString> found;
  TALIndexer::Items matched;
  for (const auto& item : results) {
    const auto& subject = item->stringValueForKey(TLAttributeKey::SUBJECT);
    if (subject && remaining.contains(*subject)) {
      found.insert(*subject);
      matched.push_back(item);
    } else {
      log().standard("[Verification Query] Doc with No Subject Match: <{}>",
                     platform::redacted(subject));
    }
  }
  for (const TLString& subject : found) remaining.erase(subject);
  for (const TLString& subject : remaining) {
    log().standard("[Verification Query] Failed to find with regular search the subject: <{}>",
                   platform::redacted(subject));
  }
  if (remaining.empty()) {
    log().standard("Verification Query Successful");
    return matched;
  }
  log().standard(
      "[Verification Query] Couldn't find results for {} subjects, will use a slow linear search "
      "for finding the subjects",
      remaining.size());
  return indexer.iterateAllDocsToFindMatchingSubjects(subjects, error);
}
