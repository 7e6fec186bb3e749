#include <gmock/gmock.h>

#include <clocale>
#include <random>

#include "screen/Model.h"

using cli::SortOrder;
using mailscreen::Command;
using mailscreen::Event;
using mailscreen::Failure;
using mailscreen::Found;
using mailscreen::Key;
using mailscreen::Mail;
using mailscreen::MailRequest;
using mailscreen::Mode;
using mailscreen::Model;
using mailscreen::Row;
using mailscreen::Search;
using testing::HasSubstr;

namespace {

class ModelTest : public testing::Test {
 protected:
  void SetUp() override {
    ASSERT_NE(std::setlocale(LC_CTYPE, "C.UTF-8"), nullptr);
    model.resize(24, 80);
  }

  void press(Key key) { model.press({key}); }
  void type(const std::string& text) { model.press({Key::text, text}); }

  static Row row(size_t number) {
    Row row;
    row.identifier = "mail" + std::to_string(number);
    row.path = "/m/" + std::to_string(number);
    row.place = row.path + ":0";
    row.folder = "Work";
    return row;
  }

  // Answers the model's next search with a page of `total` results.
  Search answer(size_t total, bool complete = true) {
    const Search search = model.nextSearch().value();
    Found found{search};
    for (size_t i = search.offset; i < std::min(total, search.offset + search.limit); ++i) {
      found.rows.push_back(row(i));
    }
    found.total = total;
    found.complete = complete;
    found.words = {search.words};
    model.take(found);
    return search;
  }
  Search fail(Failure failure, const std::string& reason) {
    Found found{model.nextSearch().value()};
    found.failure = failure;
    found.reason = reason;
    model.take(found);
    return found.search;
  }
  // Answers the model's next mail request.
  MailRequest load(const mailscreen::Glyphs& text, bool cut = false) {
    const MailRequest request = model.nextMail().value();
    model.take(Mail{request, text, cut});
    return request;
  }
  [[nodiscard]] std::string selected() const {
    return model.selected() < model.rows().size() ? model.rows()[model.selected()].identifier : "";
  }

  Model model;
};

}  // namespace

TEST_F(ModelTest, EachChangeOfTheLineIsASearch) {
  EXPECT_FALSE(model.nextSearch());
  type("inv");
  EXPECT_EQ(answer(3).words, "inv");
  EXPECT_FALSE(model.nextSearch());
  press(Key::down);
  EXPECT_EQ(selected(), "mail1");
  press(Key::left);
  EXPECT_FALSE(model.nextSearch());
  press(Key::deleteBefore);
  EXPECT_EQ(selected(), "mail1") << "what was found stays until there is something else";
  EXPECT_EQ(answer(2).words, "iv");
  EXPECT_EQ(selected(), "mail0");
  type("x");
  type("y");
  EXPECT_EQ(answer(0).words, "ixyv");
  EXPECT_EQ(model.statusText(), "no match");
  press(Key::end);
  press(Key::deleteToStart);
  EXPECT_FALSE(model.nextSearch());
  type(" ");
  EXPECT_FALSE(model.nextSearch());
  EXPECT_THAT(model.statusText(), HasSubstr("F1"));
}

TEST_F(ModelTest, DropsOutdatedResults) {
  type("a");
  const auto first = model.nextSearch();
  type("b");
  const auto second = model.nextSearch();
  ASSERT_TRUE(first && second);
  model.take(Found{*first, {row(7)}, 1});
  EXPECT_TRUE(model.rows().empty());
  model.take(Found{*second, {row(8)}, 1});
  EXPECT_EQ(selected(), "mail8");
  type("c");
  const auto third = model.nextSearch();
  press(Key::deleteToStart);
  EXPECT_TRUE(model.rows().empty());
  model.take(Found{*third, {row(9)}, 1});
  EXPECT_TRUE(model.rows().empty()) << "the line is empty";
}

TEST_F(ModelTest, PagesContinueAtBothEndsOfTheList) {
  type("a");
  const size_t page = answer(20).limit;
  ASSERT_EQ(page, model.layout().list.rows);
  EXPECT_EQ(model.settingsText(), "1-8 of 20");
  press(Key::pageUp);
  EXPECT_FALSE(model.nextSearch());
  press(Key::pageDown);
  press(Key::pageDown);  // the first page has not arrived yet
  EXPECT_EQ(answer(20).offset, page);
  EXPECT_EQ(selected(), "mail8");
  press(Key::up);
  EXPECT_EQ(answer(20).offset, 0u);
  EXPECT_EQ(selected(), "mail7");
  press(Key::down);
  EXPECT_EQ(answer(20, false).offset, page);
  EXPECT_EQ(selected(), "mail8");
  EXPECT_EQ(model.settingsText(), "9-16 and more");
  press(Key::pageDown);
  answer(20);
  EXPECT_EQ(model.settingsText(), "17-20 of 20");
  press(Key::pageDown);
  EXPECT_FALSE(model.nextSearch());
  for (int i = 0; i < 5; ++i) press(Key::down);
  EXPECT_EQ(selected(), "mail19");
  EXPECT_FALSE(model.nextSearch());
  type("b");
  EXPECT_EQ(answer(1).offset, 0u);
}

TEST_F(ModelTest, OrderThreadsAndFolder) {
  type("a");
  answer(3);
  press(Key::order);
  EXPECT_EQ(answer(3).order, SortOrder::date);
  EXPECT_EQ(model.settingsText(), "newest first  1-3 of 3");
  press(Key::threads);
  const auto search = model.nextSearch();
  ASSERT_TRUE(search && search->threads);
  Found found{*search, {row(0), row(1), row(2)}, 2};
  found.rows[0].together = 2;
  found.rows[1].follows = true;
  model.take(found);
  EXPECT_EQ(model.settingsText(), "newest first  conversations  1-2 of 2");
  press(Key::folder);
  EXPECT_EQ(model.mode(), Mode::folder);
  EXPECT_EQ(model.folderLine().text(), "Work") << "the folder of the selected mail";
  press(Key::escape);
  EXPECT_FALSE(model.nextSearch());
  press(Key::folder);
  press(Key::deleteToStart);
  type("Home");
  EXPECT_FALSE(model.nextSearch());
  press(Key::enter);
  EXPECT_EQ(answer(3).folder, "Home");
  EXPECT_THAT(model.settingsText(), HasSubstr("in Home"));
  press(Key::deleteToStart);
  EXPECT_EQ(answer(3).words, "") << "all mail of the folder";
  press(Key::folder);
  EXPECT_EQ(model.folderLine().text(), "Home");
  press(Key::deleteToStart);
  press(Key::enter);
  EXPECT_FALSE(model.nextSearch());
  EXPECT_TRUE(model.rows().empty());
  EXPECT_FALSE(model.done());
}

TEST_F(ModelTest, TheSelectedMailIsPreviewed) {
  EXPECT_FALSE(model.nextMail());
  type("a");
  answer(3);
  mailscreen::Glyphs text;
  for (int i = 0; i < 100; ++i) text += i == 60 ? U"\x02hit\x01\n" : U"line\n";
  const auto request = load(text);
  EXPECT_EQ(request, (MailRequest{"mail0", {"a"}, false}));
  EXPECT_FALSE(model.nextMail());
  // Scrolled so that the first match is visible.
  EXPECT_LE(model.firstLine(), 60u);
  EXPECT_GT(model.firstLine() + model.layout().preview.rows, 60u);
  press(Key::down);
  const auto second = model.nextMail();
  press(Key::down);
  const auto third = model.nextMail();
  ASSERT_TRUE(second && third);
  model.take(Mail{*second, U"overtaken"});
  EXPECT_EQ(model.document().lines(), 100u);
  model.take(Mail{*third, U"short"});
  EXPECT_EQ(model.document().lines(), 1u);
  EXPECT_EQ(model.firstLine(), 0u);
  // Without space for a preview, no mail is read.
  model.resize(5, 40);
  answer(3);
  press(Key::up);
  EXPECT_FALSE(model.nextMail());
  model.resize(5, 120);
  EXPECT_EQ(load(U"x").identifier, "mail1");
}

TEST_F(ModelTest, AMailIsReadAndScrolled) {
  press(Key::enter);
  EXPECT_EQ(model.mode(), Mode::searching) << "there is none";
  type("a");
  answer(3);
  load(U"beginning", true);
  press(Key::enter);
  EXPECT_EQ(model.mode(), Mode::reading);
  mailscreen::Glyphs text;
  for (int i = 0; i < 100; ++i) text += U"line\n";
  EXPECT_EQ(load(text), (MailRequest{"mail0", {"a"}, true}));
  EXPECT_EQ(model.settingsText(), "1-23 of 100");
  type("j ");
  EXPECT_EQ(model.firstLine(), 23u);
  press(Key::end);
  press(Key::down);
  EXPECT_EQ(model.firstLine(), 77u);
  model.resize(90, 80);
  EXPECT_EQ(model.firstLine(), 11u);
  type("b");
  EXPECT_EQ(model.firstLine(), 0u);
  EXPECT_EQ(answer(3).limit, model.layout().list.rows);
  type("n");
  EXPECT_EQ(load(U"next").identifier, "mail1");
  type("nnp");
  EXPECT_EQ(selected(), "mail1");
  type("?");
  EXPECT_EQ(model.mode(), Mode::help);
  type("q");
  EXPECT_EQ(model.mode(), Mode::reading);
  type("q");
  EXPECT_EQ(model.mode(), Mode::searching);
  EXPECT_FALSE(model.nextMail()) << "the whole of it is there";
  EXPECT_FALSE(model.done());
  press(Key::escape);
  EXPECT_TRUE(model.done());
}

TEST_F(ModelTest, CommandsApplyToTheSelectedMail) {
  press(Key::copy);
  EXPECT_FALSE(model.nextCommand());
  EXPECT_EQ(model.statusText(), "no mail is selected");
  type("a");
  EXPECT_NE(model.statusText(), "no mail is selected");
  answer(3);
  press(Key::down);
  press(Key::copy);
  auto command = model.nextCommand().value();
  EXPECT_EQ(command.kind, Command::Kind::copy);
  EXPECT_EQ(command.place, "/m/1:0");
  press(Key::enter);
  type("o");
  command = model.nextCommand().value();
  EXPECT_EQ(command.kind, Command::Kind::open);
  EXPECT_EQ(command.place, "/m/1");
  EXPECT_FALSE(model.nextCommand());
  press(Key::suspend);
  EXPECT_TRUE(model.nextCommand());
  press(Key::interrupt);
  EXPECT_TRUE(model.done());
}

TEST_F(ModelTest, AQuestionMarkIsHelpOnlyInAnEmptyLine) {
  type("?");
  EXPECT_EQ(model.mode(), Mode::help);
  EXPECT_GT(model.document().lines(), 20u);
  model.resize(3, 10);
  press(Key::end);
  EXPECT_GT(model.firstLine(), 20u);
  type("?");
  EXPECT_EQ(model.mode(), Mode::searching);
  type("what");
  type("?");
  EXPECT_EQ(model.line().text(), "what?");
  press(Key::help);
  EXPECT_EQ(model.mode(), Mode::help);
}

TEST_F(ModelTest, ReportsAndRetriesFailures) {
  type("a");
  answer(3);
  type("b");
  fail(Failure::unreachable, "not running");
  EXPECT_EQ(model.statusText(), "not running; trying again");
  EXPECT_EQ(model.rows().size(), 3u);
  EXPECT_TRUE(model.wantsRetry());
  EXPECT_FALSE(model.nextSearch());
  model.retry();
  EXPECT_EQ(fail(Failure::refused, "locked").words, "ab");
  EXPECT_EQ(model.statusText(), "locked; trying again");
  EXPECT_TRUE(model.rows().empty()) << "what is locked is not shown any more";
  model.retry();
  answer(2);
  EXPECT_FALSE(model.wantsRetry());
  type("(");
  fail(Failure::query, "what?");
  EXPECT_EQ(model.statusText(), "what?");
  EXPECT_FALSE(model.wantsRetry());
  EXPECT_EQ(model.rows().size(), 2u);
}

// The model can always be drawn after random keys, sizes and answers.
TEST_F(ModelTest, SurvivesRandomHistories) {
  std::mt19937 random(5);
  std::optional<Search> search;
  std::optional<MailRequest> request;
  for (int step = 0; step < 200000 && !HasFailure(); ++step) {
    const auto chance = random() % 10;
    if (chance == 0) {
      model.resize(random() % 40, random() % 140);
    } else if (chance == 1 && search) {
      Found found{*search};
      found.failure = static_cast<Failure>(random() % 8 < 3 ? random() % 4 : 0);
      for (size_t i = 0, n = random() % 30; i < n && found.failure == Failure::none; ++i) {
        found.rows.push_back(row(i));
        found.rows.back().follows = i > 0 && random() % 4 == 0;
      }
      found.total = random() % 60;
      found.complete = random() % 2 == 0;
      model.take(found);
      model.retry();
    } else if (chance == 2 && request) {
      mailscreen::Glyphs text;
      for (size_t i = 0, n = random() % 300; i < n; ++i) text += i % 7 == 0 ? U"\n" : U"word ";
      model.take(Mail{*request, text, random() % 2 == 0});
    } else {
      auto key = static_cast<Key>(random() % (static_cast<unsigned>(Key::help) + 1));
      if (key == Key::interrupt || (key == Key::escape && model.mode() == Mode::searching)) {
        key = Key::text;
      }
      model.press({key, key == Key::text ? std::string(1, "ab ?qjnpG"[random() % 9]) : ""});
    }
    if (auto next = model.nextSearch()) search = next;
    if (auto next = model.nextMail()) request = next;
    (void)model.nextCommand();
    const size_t rows = model.rows().size();
    EXPECT_TRUE(rows == 0 ? model.selected() == 0 : model.selected() < rows);
    EXPECT_LE(model.firstRow(), model.selected());
    EXPECT_LE(model.firstLine(), model.document().lines());
    EXPECT_FALSE(model.done());
    EXPECT_LE(model.statusText().size() + model.settingsText().size(), 1000u);
  }
}
