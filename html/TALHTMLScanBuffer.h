#pragma once

#include <string_view>

#include "html/TALHTMLParsing.h"

// `tag` is the whole tag, including "<" and ">".
using TALHTMLTagCallback = void (*)(std::string_view tag, TALHTMLParsing& parsing);
using TALHTMLAttributeCallback = void (*)(std::string_view name, std::string_view value,
                                          TALHTMLParsing& parsing);

// Scans `bytes` once from start to end and appends the text to `parsing`. Callbacks may be null;
// the views passed to them point into `bytes`.
void TALHTMLScanBuffer(std::string_view bytes, TALHTMLTagCallback startTag,
                       TALHTMLTagCallback endTag, TALHTMLAttributeCallback attribute,
                       TALHTMLParsing& parsing);

// The callbacks that build a document's text, title and attributes. Tag names are compared
// case-insensitively and by their beginning only.
void TALHTMLStartTag(std::string_view tag, TALHTMLParsing& parsing);
void TALHTMLEndTag(std::string_view tag, TALHTMLParsing& parsing);
void TALHTMLAttribute(std::string_view name, std::string_view value, TALHTMLParsing& parsing);

// Appends the character of an entity, given from its "&" up to its ";" if it has one. Ignores
// unknown entities. An empty entity is a programming error.
void TALHTMLDecodeEntity(std::string_view entity, TALHTMLParsing& parsing);
