#pragma once

#include <string_view>

#include "indexer/TALHTMLParsing.h"

// A whole tag, with "<" and ">".
using TALHTMLTagCallback = void (*)(std::string_view tag, TALHTMLParsing& parsing);
using TALHTMLAttributeCallback = void (*)(std::string_view name, std::string_view value,
                                          TALHTMLParsing& parsing);

// Scans `bytes` once, from the first to the last, and appends the text to `parsing`. Callbacks may
// be null. The views that they get are parts of `bytes`.
void TALHTMLScanBuffer(std::string_view bytes, TALHTMLTagCallback startTag,
                       TALHTMLTagCallback endTag, TALHTMLAttributeCallback attribute,
                       TALHTMLParsing& parsing);

// The callbacks that make a document's text, title and attributes. Names of tags are compared in
// any case and by their beginning only.
void TALHTMLStartTag(std::string_view tag, TALHTMLParsing& parsing);
void TALHTMLEndTag(std::string_view tag, TALHTMLParsing& parsing);
void TALHTMLAttribute(std::string_view name, std::string_view value, TALHTMLParsing& parsing);

// Appends what an entity stands for, from its "&" to its ";" if it has one. Nothing for one that is
// unknown. An empty one is a programming error.
void TALHTMLDecodeEntity(std::string_view entity, TALHTMLParsing& parsing);
