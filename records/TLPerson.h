#pragma once

#include "records/RecordAccessors.h"
#include "records/TLCodable.h"

// A name and a mail address.
class TLPerson final : public TLRecord<TLPerson> {
 public:
  TL_RECORD_STRING(name, Name)
  TL_RECORD_STRING(emailAddress, EmailAddress)

 private:
  friend struct TLRecordTable<TLPerson>;
};

extern template class TLRecord<TLPerson>;
