#pragma once

#include "records/RecordAccessors.h"
#include "records/TLCodable.h"
#include "records/TLParameters.h"
#include "records/TLQueryNode.h"

// What a client hands to a search. A search replaces searchParams by the resolved set, so a query
// is not shared between two searches that run at once.
class TLQuery final : public TLRecord<TLQuery> {
 public:
  // The tree of conditions; absent where there is none.
  TL_RECORD_RECORD(TLQueryNode, root, Root)
  // Carried for the client: language, country and tokenizedQuery are not read by the daemon.
  TL_RECORD_STRING(language, Language)
  TL_RECORD_STRING(country, Country)
  // The query as the client typed it.
  TL_RECORD_STRING(rawQuery, RawQuery)
  // The free text of the query, words separated by one space.
  TL_RECORD_STRING(originalQuery, OriginalQuery)
  TL_RECORD_STRING(tokenizedQuery, TokenizedQuery)
  TL_RECORD_RECORD(TLParameters, searchParams, SearchParams)

 private:
  friend struct TLRecordTable<TLQuery>;
};

extern template class TLRecord<TLQuery>;
