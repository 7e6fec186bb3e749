#pragma once

#include "records/RecordAccessors.h"
#include "records/TLCodable.h"

// The ranking scores that a search attaches to an item.
class TLCard final : public TLRecord<TLCard> {
 public:
  TL_RECORD_SCALAR(float, textScore, TextScore, 16)
  TL_RECORD_SCALAR(float, lightScore, LightScore, 8)
  TL_RECORD_SCALAR(float, fullScore, FullScore, 4)
  // The item's MAIL_DATE_RECEIVED, seconds since 1970.
  TL_RECORD_SCALAR(double, mailDateReceived, MailDateReceived, 2)
  TL_RECORD_SCALAR(double, freshness, Freshness, 1)

 private:
  friend struct TLRecordTable<TLCard>;
};

extern template class TLRecord<TLCard>;
