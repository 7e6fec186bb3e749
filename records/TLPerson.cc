#include "records/TLPerson.h"

#include "records/RecordFields.h"

template <>
struct TLRecordTable<TLPerson> {
  static constexpr const char* name = "TLPerson";
  static constexpr std::tuple fields{
      TLField{1, "name", &TLPerson::_name},
      TLField{2, "emailAddress", &TLPerson::_emailAddress},
  };
};

template class TLRecord<TLPerson>;
