#include "zones/zone.h"

namespace zone {

size_t Zone::beginValue() {
  if (!text.empty()) text.push_back('\0');
  return text.size();
}

void Zone::AddText(TLStringView value, const tokenizer::Tokenizer& tokenizer) {
  beginValue();
  tokenizer.TokenizeToText(value, text, offsets);
}

void Zone::AddTokenizedText(std::string_view value) {
  const size_t start = beginValue();
  text.append(value);
  if (value.empty()) return;
  offsets.push_back(static_cast<uint32_t>(start));
  for (size_t i = 1; i < value.size(); ++i) {
    if (value[i - 1] == ' ') offsets.push_back(static_cast<uint32_t>(start + i));
  }
}

void Zone::AddTextAsIs(std::string_view value) {
  offsets.push_back(static_cast<uint32_t>(beginValue()));
  text.append(value);
}

}  // namespace zone
