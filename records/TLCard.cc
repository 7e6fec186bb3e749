#include "records/TLCard.h"

#include "records/RecordFields.h"

template <>
struct TLRecordTable<TLCard> {
  static constexpr const char* name = "TLCard";
  static constexpr std::tuple fields{
      TLField{1, "textScore", &TLCard::_textScore, TLCard::kTextScoreBit},
      TLField{2, "lightScore", &TLCard::_lightScore, TLCard::kLightScoreBit},
      TLField{3, "fullScore", &TLCard::_fullScore, TLCard::kFullScoreBit},
      TLField{15, "mailDateReceived", &TLCard::_mailDateReceived, TLCard::kMailDateReceivedBit},
      TLField{16, "freshness", &TLCard::_freshness, TLCard::kFreshnessBit},
  };
};

template class TLRecord<TLCard>;
