#include <gtest/gtest.h>

#include "records/TLAttribute.h"
#include "records/TLAttributeKey.h"
#include "records/TLQueryNode.h"

TEST(AttributeKey, NumbersAndNamesOfNodes) {
  EXPECT_EQ(TLQueryNode::keysAsString(171), "TEXT_CONTENT");
  EXPECT_EQ(TLQueryNode::opAsString(TLQueryNodeOp(21)), "BOOL_CONSTANT");
  EXPECT_EQ(TLQueryNode::keysAsString(2), "(unknown: 2)");
  EXPECT_EQ(TLAttribute::keyAsString(TLAttributeKey(-1)), "(unknown: -1)");
  EXPECT_EQ(TLQueryNode::opAsString(TLQueryNodeOp(7)), "(unknown: 7)");
  EXPECT_EQ(TLQueryNode::mergeOpAsString(TLQueryNodeMergeOp(3)), "(unknown: 3)");
  EXPECT_EQ(TLQueryNode::StringAsKeys("NO_SUCH_KEY"), 0);
  EXPECT_EQ(TLAttribute::StringAsKey("subject"), TLAttributeKey::UNKNOWN);
  EXPECT_EQ(TLQueryNode::StringAsOp("NO_SUCH_OP"), TLQueryNodeOp::STRING_EQUAL);
  EXPECT_EQ(TLQueryNode::StringAsMergeOp("XOR"), TLQueryNodeMergeOp::LEAF);
}

TEST(AttributeKey, NamesOfTheQueryLanguage) {
  EXPECT_EQ(TLAttributeKeyForQueryName("**"), TLAttributeKey::ANY);
  EXPECT_EQ(TLAttributeKeyForQueryName("*"), TLAttributeKey::ANY_METADATA);
  EXPECT_EQ(TLAttributeKeyForQueryName("kTLItemMailboxes"), TLAttributeKey::MAILBOX_IDENTIFIERS);
  EXPECT_EQ(TLAttributeKeyForQueryName("com_quill_mail_read"), TLAttributeKey::READ);
  EXPECT_EQ(TLAttributeKeyForQueryName("ktlitemsubject"), std::nullopt);
  EXPECT_EQ(TLAttributeKeyForQueryName(""), std::nullopt);
}
