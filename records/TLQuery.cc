#include "records/TLQuery.h"

#include "records/RecordFields.h"

template <>
struct TLRecordTable<TLQuery> {
  static constexpr const char* name = "TLQuery";
  static constexpr std::tuple fields{
      TLField{1, "root", &TLQuery::_root},
      TLField{2, "language", &TLQuery::_language},
      TLField{3, "country", &TLQuery::_country},
      TLField{4, "rawQuery", &TLQuery::_rawQuery},
      TLField{5, "originalQuery", &TLQuery::_originalQuery},
      TLField{6, "tokenizedQuery", &TLQuery::_tokenizedQuery},
      TLField{7, "searchParams", &TLQuery::_searchParams},
  };
};

template class TLRecord<TLQuery>;
