#include "cli/FlowedText.h"

#include <algorithm>

namespace cli {

TLString unflow(TLStringView text, bool delSp) {
  constexpr TLStringView kSignature = u"-- ";
  TLString out;
  out.reserve(text.size());
  size_t openDepth = TLStringView::npos;  // quote depth of the line that continues, if any
  while (!text.empty()) {
    const size_t feed = text.find(u'\n');
    TLStringView line = text.substr(0, feed);
    text.remove_prefix(feed == TLStringView::npos ? text.size() : feed + 1);

    const size_t depth = std::min(line.find_first_not_of(u'>'), line.size());
    TLStringView content = line.substr(depth);
    if (content.starts_with(u' ')) content.remove_prefix(1);
    const bool goesOn = content.ends_with(u' ') && content != kSignature;
    const bool joins = openDepth == depth && content != kSignature;
    if (openDepth != TLStringView::npos && !joins) out.push_back(u'\n');
    if (!joins && depth > 0) out.append(depth, u'>').push_back(u' ');
    out += goesOn && delSp ? content.substr(0, content.size() - 1) : content;
    if (!goesOn && feed != TLStringView::npos) out.push_back(u'\n');
    openDepth = goesOn ? depth : TLStringView::npos;
  }
  return out;
}

}  // namespace cli
