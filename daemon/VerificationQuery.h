#pragma once

#include <optional>
#include <vector>

#include "indexer/TALIndexer.h"
#include "platform/TLError.h"
#include "platform/Text.h"
#include "records/TLQuery.h"

// A verification query only asks whether messages with given subjects exist: an OR of at least five
// equality comparisons of the subject. A search is tried first; where it does not find each
// subject, all stored documents are compared. Any thread.

[[nodiscard]] bool isMailVerificationQuery(const TLQuery* query);

// The subjects in the text of a verification query, in order, without their escapes.
[[nodiscard]] TALIndexer::Strings subjectsFromRawQuery(TLStringView rawQuery);

// The documents with one of the subjects. Null after a failure, with `error` set. The resolved
// parameters are written into the query.
[[nodiscard]] std::optional<TALIndexer::Items> handleVerificationQueryWithIndexer(
    TALIndexer& indexer, TLQuery& query, const TALIndexer::Strings& subjects, TLErrorOut error);
