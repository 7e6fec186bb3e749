#pragma once

#include "records/RecordAccessors.h"
#include "records/TLCodable.h"
#include "records/TLParameters.h"
#include "records/TLQueryNode.h"

// A search request from a client. A search replaces searchParams by the resolved set, so concurrent
// searches must not share a query.
class TLQuery final : public TLRecord<TLQuery> {
 public:
  // The condition tree; absent if there is none.
  TL_RECORD_RECORD(TLQueryNode, root, Root)
  // For the client only: the daemon does not read language, country and tokenizedQuery.
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
