#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

// Keys of attributes, query nodes and zones in one number space. They are stored in indexes, so the
// numbers never change. X(name, number), in ascending number.
#define TL_ATTRIBUTE_KEYS(X)                         \
  X(UNKNOWN, 0)                                      \
  X(CUSTOM, 1)                                       \
  X(ANY, 3)                                          \
  X(ANY_METADATA, 4)                                 \
  X(AUDIENCES, 6)                                    \
  X(CONTENT_DESCRIPTION, 7)                          \
  X(KIND, 8)                                         \
  X(SUBJECT, 13)                                     \
  X(IMPORTANT_DATES, 19)                             \
  X(START_DATE, 20)                                  \
  X(ALTERNATE_NAMES, 21)                             \
  X(CONTENT_TYPE, 22)                                \
  X(CONTENT_TYPE_TREE, 23)                           \
  X(CONTENT_URL, 24)                                 \
  X(DISPLAY_NAME, 25)                                \
  X(KEYWORDS, 26)                                    \
  X(METADATA_MODIFICATION_DATE, 27)                  \
  X(URL, 28)                                         \
  X(MAIL_MESSAGE_ID, 100)                            \
  X(MAIL_DATE_RECEIVED, 101)                         \
  X(CONTENT_CREATION_DATE, 103)                      \
  X(HTML_CONTENT_DATA, 104)                          \
  X(ACCOUNT_HANDLES, 105)                            \
  X(ACCOUNT_IDENTIFIER, 106)                         \
  X(AUTHORS, 107)                                    \
  X(AUTHOR_EMAIL_ADDRESSES, 108)                     \
  X(AUTHOR_ADDRESSES, 109)                           \
  X(AUTHOR_NAMES, 110)                               \
  X(RECIPIENTS, 111)                                 \
  X(RECIPIENT_EMAIL_ADDRESSES, 112)                  \
  X(RECIPIENT_ADDRESSES, 113)                        \
  X(RECIPIENT_NAMES, 114)                            \
  X(ADDITIONAL_RECIPIENTS, 115)                      \
  X(ADDITIONAL_RECIPIENT_EMAIL_ADDRESSES, 116)       \
  X(ADDITIONAL_RECIPIENT_ADDRESSES, 117)             \
  X(ADDITIONAL_RECIPIENT_NAMES, 118)                 \
  X(HIDDEN_ADDITIONAL_RECIPIENTS, 119)               \
  X(HIDDEN_RECIPIENT_EMAIL_ADDRESSES, 120)           \
  X(HIDDEN_RECIPIENT_ADDRESSES, 121)                 \
  X(HIDDEN_RECIPIENT_NAMES, 122)                     \
  X(ITEM_IS_EXISTING_THREAD, 123)                    \
  X(DATA_OWNER_TYPE, 124)                            \
  X(ACCOUNT_TYPE, 127)                               \
  X(SECURITY_METHOD, 130)                            \
  X(ATTACHMENT_TYPES, 131)                           \
  X(ATTACHMENT_NAMES, 132)                           \
  X(ATTACHMENT_PATHS, 133)                           \
  X(ATTACHMENT_KINDS, 134)                           \
  X(BEACON_ATTRIBUTE_ATTACHMENT_SPECIFIC_TYPES, 135) \
  X(CONVERSATION_ID, 136)                            \
  X(GMAIL_LABELS, 137)                               \
  X(MAILBOXES, 138)                                  \
  X(IS_LIKELY_JUNK, 139)                             \
  X(DATE_LAST_VIEWED, 140)                           \
  X(LAST_USED_DATE, 141)                             \
  X(READ, 142)                                       \
  X(FLAGGED, 143)                                    \
  X(REPLIED_TO, 144)                                 \
  X(FLAG_COLOR, 145)                                 \
  X(PRIORITY, 146)                                   \
  X(X_FROM, 147)                                     \
  X(MAILBOX_IDENTIFIERS, 165)                        \
  X(TEXT_CONTENT, 171)                               \
  X(CONTENT_SNIPPET, 172)                            \
  X(RELATED_UNIQUE_IDENTIFIER, 180)

// How a leaf compares its attribute with its value. 6 to 9 are unused.
#define TL_QUERY_NODE_OPS(X)                \
  X(STRING_EQUAL, 1)                        \
  X(STRING_EQUAL_WORD_BREAK, 2)             \
  X(STRING_EQUAL_LAST_PREFIX, 3)            \
  X(STRING_EQUAL_WORD_BREAK_LAST_PREFIX, 4) \
  X(STRING_NOT_EQUAL, 5)                    \
  X(INT_EQUAL, 10)                          \
  X(INT_LESS, 11)                           \
  X(INT_LESS_EQUAL, 12)                     \
  X(INT_GREATER, 13)                        \
  X(INT_GREATER_EQUAL, 14)                  \
  X(FLOAT_EQUAL, 15)                        \
  X(FLOAT_LESS, 16)                         \
  X(FLOAT_LESS_EQUAL, 17)                   \
  X(FLOAT_GREATER, 18)                      \
  X(FLOAT_GREATER_EQUAL, 19)                \
  X(BOOL_EQUAL, 20)                         \
  X(BOOL_CONSTANT, 21)

// The kind of a query node.
#define TL_QUERY_NODE_MERGE_OPS(X) X(LEAF, 0) X(AND, 1) X(OR, 2)

#define TL_ENUMERATOR(name, number) name = number,
enum class TLAttributeKey : int32_t { TL_ATTRIBUTE_KEYS(TL_ENUMERATOR) };
enum class TLQueryNodeOp : int32_t { TL_QUERY_NODE_OPS(TL_ENUMERATOR) };
enum class TLQueryNodeMergeOp : int32_t { TL_QUERY_NODE_MERGE_OPS(TL_ENUMERATOR) };
#undef TL_ENUMERATOR

// A named value of one of the above enumerations.
template <typename Enum>
struct TLEnumName {
  Enum value;
  std::string_view name;
};

// The named values by ascending number.
#define TL_ENUM_NAME(name, number) {Enum::name, #name},
template <typename Enum>
struct TLEnumNames;
template <>
struct TLEnumNames<TLAttributeKey> {
  using Enum = TLAttributeKey;
  static constexpr TLEnumName<Enum> table[] = {TL_ATTRIBUTE_KEYS(TL_ENUM_NAME)};
};
template <>
struct TLEnumNames<TLQueryNodeOp> {
  using Enum = TLQueryNodeOp;
  static constexpr TLEnumName<Enum> table[] = {TL_QUERY_NODE_OPS(TL_ENUM_NAME)};
};
template <>
struct TLEnumNames<TLQueryNodeMergeOp> {
  using Enum = TLQueryNodeMergeOp;
  static constexpr TLEnumName<Enum> table[] = {TL_QUERY_NODE_MERGE_OPS(TL_ENUM_NAME)};
};
#undef TL_ENUM_NAME

// The name of a value, "(unknown: NUMBER)" outside the enumeration.
[[nodiscard]] std::string TLAttributeKeyAsString(TLAttributeKey key);
[[nodiscard]] std::string TLQueryNodeOpAsString(TLQueryNodeOp op);
[[nodiscard]] std::string TLQueryNodeMergeOpAsString(TLQueryNodeMergeOp mergeOp);

// The value with the given name; UNKNOWN, STRING_EQUAL or LEAF for an unknown name.
[[nodiscard]] TLAttributeKey TLStringAsAttributeKey(std::string_view name);
[[nodiscard]] TLQueryNodeOp TLStringAsQueryNodeOp(std::string_view name);
[[nodiscard]] TLQueryNodeMergeOp TLStringAsQueryNodeMergeOp(std::string_view name);

// An attribute name of the query language.
struct TLAttributeName {
  std::string_view name;
  TLAttributeKey key;
};

// All attribute names, sorted by name.
inline constexpr std::array<TLAttributeName, 17> kTLAttributeNames{{
    {"*", TLAttributeKey::ANY_METADATA},
    {"**", TLAttributeKey::ANY},
    {"com_quill_mail_dateReceived", TLAttributeKey::MAIL_DATE_RECEIVED},
    {"com_quill_mail_flagColor", TLAttributeKey::FLAG_COLOR},
    {"com_quill_mail_flagged", TLAttributeKey::FLAGGED},
    {"com_quill_mail_priority", TLAttributeKey::PRIORITY},
    {"com_quill_mail_read", TLAttributeKey::READ},
    {"kTLItemAccountIdentifier", TLAttributeKey::ACCOUNT_IDENTIFIER},
    {"kTLItemAuthorEmailAddresses", TLAttributeKey::AUTHOR_EMAIL_ADDRESSES},
    {"kTLItemAuthors", TLAttributeKey::AUTHORS},
    {"kTLItemContentType", TLAttributeKey::CONTENT_TYPE},
    // Mailbox conditions compare identifiers, not the names under MAILBOXES.
    {"kTLItemMailboxes", TLAttributeKey::MAILBOX_IDENTIFIERS},
    {"kTLItemRecipientEmailAddresses", TLAttributeKey::RECIPIENT_EMAIL_ADDRESSES},
    {"kTLItemRecipients", TLAttributeKey::RECIPIENTS},
    {"kTLItemRelatedUniqueIdentifier", TLAttributeKey::RELATED_UNIQUE_IDENTIFIER},
    {"kTLItemSubject", TLAttributeKey::SUBJECT},
    {"kTLItemTextContent", TLAttributeKey::TEXT_CONTENT},
}};

// The key of an attribute name of the query language; nullopt for an unknown name.
[[nodiscard]] std::optional<TLAttributeKey> TLAttributeKeyForQueryName(std::string_view name);
