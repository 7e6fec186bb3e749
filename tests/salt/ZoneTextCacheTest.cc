#include <gtest/gtest.h>

#include <array>
#include <random>

#include "salt/Coding.h"
#include "salt/IndexImpl.h"
#include "salt/ZoneTextCache.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/FileSizeLimit.h"
#include "tests/support/TemporaryDirectory.h"

namespace {

// Some zones are longer than one read-ahead, some documents have two; every tenth has none.
class ZoneTextCacheTest : public testing::Test {
 protected:
  ZoneTextCacheTest() {
    for (uint32_t doc = 1; doc <= kDocs; ++doc) {
      std::string text;
      const size_t words = doc % 10 == 0 ? 0 : 1 + _random() % (doc % 7 == 0 ? 8000 : 100);
      for (size_t i = 0; i < words; ++i) text += std::to_string(_random()) + " ";
      if (words != 0) {
        EXPECT_TRUE(salttest::addZone(*_index, doc, 3, text));
      }
      const std::string second = doc % 3 == 0 ? "second zone of " + std::to_string(doc) : "";
      if (!second.empty()) {
        EXPECT_TRUE(salttest::addZone(*_index, doc, 12, second));
      }
      _texts.push_back({std::move(text), second});
    }
  }

  void expectAllTexts(salt::ZoneTextCache* texts) {
    for (int i = 0; i < 3000; ++i) {
      salt::SuffixMeta meta{};
      meta.DocID = 1 + static_cast<uint32_t>(_random() % kDocs);
      const bool second = _random() % 4 == 0;
      meta.ZoneID = second ? 12 : 3;
      const std::string& text = _texts[meta.DocID - 1][second];
      meta.Offset = static_cast<uint32_t>(_random() % (text.size() + 3));
      EXPECT_EQ(texts->find(meta), index().suffixText(meta, text));
    }
    EXPECT_TRUE(texts->good());
  }

  [[nodiscard]] const salt::index& index() const {
    return static_cast<const salt::index&>(*_index);
  }

 private:
  static constexpr uint32_t kDocs = 200;

  std::mt19937 _random{7};
  testsupport::TemporaryDirectory _directory;
  std::unique_ptr<salt::Index> _index = salttest::newIndex(_directory.path() + "/index");
  std::vector<std::array<std::string, 2>> _texts;
};

TEST_F(ZoneTextCacheTest, GivesTheSameWithAFileOfAnyLength) {
  for (const uint64_t most : {salt::ZoneTextCache::kMaxFileBytes, uint64_t{200000}, uint64_t{0}}) {
    salt::ZoneTextCache texts(index(), most);
    expectAllTexts(&texts);
  }
}

TEST_F(ZoneTextCacheTest, WorksWhenTheFileCannotGrow) {
  salt::ZoneTextCache texts(index());
  {
    const testsupport::FileSizeLimit limit(100000);
    expectAllTexts(&texts);
  }
  expectAllTexts(&texts);
}

}  // namespace
