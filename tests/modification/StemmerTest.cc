#include <gtest/gtest.h>

#include "modification/Stemmer.h"
#include "platform/Text.h"

TEST(Stemmer, FollowsTheRulesOfEachStep) {
  struct Step {
    const char* name;
    const char* words;  // alternating words and stems
  };
  const Step steps[] = {
      {"words of one or two letters stay", "a a, s s, is is, be be, by by, as as, ed ed"},
      {"1a, sses ies ss s",
       "caresses caress, passes pass, ponies poni, ties ti, flies fli, caress caress, glass glass, "
       "cats cat, gas ga, this thi, pass pass"},
      {"1b, eed", "feed feed, bleed bleed, freed freed, agreed agre, succeed succe, decreed decre"},
      {"1b, ed and ing with no vowel before",
       "bled bled, shed shed, red red, sing sing, bring bring, king king, spring spring, thing "
       "thing"},
      {"1b, ed and ing, then at bl iz",
       "conflated conflat, created creat, troubled troubl, enabled enabl, sized size, realizing "
       "realiz"},
      {"1b, ed and ing, then a double letter",
       "hopping hop, tanned tan, planned plan, running run, falling fall, hissing hiss, fizzed "
       "fizz, controlled control, added ad"},
      {"1b, ed and ing, then a short word",
       "failing fail, filing file, hoping hope, fixing fix, snowing snow, playing plai, meeting "
       "meet, mailed mail, noted note, used us, paying pai"},
      {"1b leaves one letter", "aed a, aing a, oed o"},
      {"1c",
       "happy happi, sky sky, cry cry, enjoy enjoi, reply repli, by by, company compani, say sai, "
       "yying yy, yyyy yyyi, syzygy syzygi"},
      {"2, by the last letter but one a c e g",
       "relational relat, rational ration, conditional condit, optional option, valenci valenc, "
       "hesitanci hesit, digitizer digit, organizer organ, analogi analog, archaeologi archaeolog, "
       "logi logi, apologi apolog"},
      {"2, l",
       "conformabli conform, sensibli sensibl, bli bli, radicalli radic, differentli differ, "
       "vileli vile, analogousli analog, alli alli"},
      {"2, o",
       "vietnamization vietnam, organization organ, predication predic, ration ration, operator "
       "oper, creator creator"},
      {"2, s", "feudalism feudal, decisiveness decis, hopefulness hope, callousness callous"},
      {"2, t",
       "formaliti formal, sensitiviti sensit, sensibiliti sensibl, possibiliti possibl, aliti "
       "aliti"},
      {"3",
       "triplicate triplic, duplicate duplic, formative form, native nativ, formalize formal, "
       "electriciti electr, electrical electr, practical practic, hopeful hope, awful aw, goodness "
       "good, witness wit"},
      {"4, al ance ence er ic",
       "revival reviv, total total, allowance allow, balance balanc, inference infer, presence "
       "presenc, airliner airlin, user user, gyroscopic gyroscop, basic basic"},
      {"4, able ible ant ement ment ent",
       "adjustable adjust, able abl, defensible defens, irritant irrit, giant giant, replacement "
       "replac, element element, adjustment adjust, payment payment, dependent depend, agent "
       "agent, cement cement"},
      {"4, ion after s or t only",
       "adoption adopt, decision decis, champion champion, companion companion, nation nation, "
       "region region"},
      {"4, ou ism ate iti ous ive ize",
       "homologou homolog, communism commun, prism prism, activate activ, private privat, "
       "angulariti angular, homologous homolog, effective effect, bowdlerize bowdler, prize prize"},
      {"5a",
       "probate probat, rate rate, cease ceas, hope hope, invoice invoic, schedule schedul, cable "
       "cabl, argue argu"},
      {"5b", "controll control, roll roll, install instal, recall recal, full full"},
      {"several steps in a row",
       "generalizations gener, oscillators oscil, relational relat, connections connect, "
       "operational oper, communications commun, electricity electr, universities univers, "
       "university univers, responsibilities respons"},
      {"y, digits and other bytes are letters too",
       "toys toi, b2b b2b, 4x4s 4x4, q1 q1, covid19s covid19, caf\u00e9s caf\u00e9"},
      {"mail",
       "invoices invoic, invoiced invoic, invoicing invoic, meetings meet, scheduled schedul, "
       "scheduling schedul, replies repli, replied repli, attachments attach, attached attach, "
       "deliveries deliveri, delivered deliv, booking book, bookings book, cancelled cancel, "
       "cancellation cancel, confirming confirm, confirmation confirm, subscriptions subscript, "
       "unsubscribe unsubscrib"},
  };
  size_t words = 0;
  for (const auto& [name, pairs] : steps) {
    std::istringstream in(pairs);
    for (std::string word, expected; in >> word >> expected; ++words) {
      if (expected.ends_with(',')) expected.pop_back();
      EXPECT_EQ(TALStemWord(word, 100), expected) << name << ": " << word;
    }
  }
  EXPECT_GE(words, 200u);
}

TEST(Stemmer, WorksInPlaceOnTheCallersRecord) {
  stemmer* record = create_stemmer();
  std::string word = "hoppingX";
  EXPECT_EQ(stem(record, word.data(), 6), 2);
  EXPECT_EQ(word.substr(0, 3), "hop");
  EXPECT_EQ(word.back(), 'X');
  word = "is";
  EXPECT_EQ(stem(record, word.data(), 1), 1);
  EXPECT_EQ(stem(record, word.data(), -1), -1);
  free_stemmer(record);
}

TEST(Stemmer, LimitsTheLengthInBytesAndSplitsNoCharacter) {
  const std::string hundred = std::string(96, 'b') + "ains";
  EXPECT_EQ(TALStemWord(hundred, 100), hundred.substr(0, 99));
  EXPECT_EQ(TALStemWord('b' + hundred, 100), 'b' + hundred);
  EXPECT_EQ(TALStemWord("ponies", -1), "ponies");
  EXPECT_EQ(TALStemWord("", 100), "");
  EXPECT_EQ(TALStemWord("\U0001F600\U0001F600", 100), "\U0001F600\U0001F600");
  EXPECT_EQ(TALStemWord("a\U00010000ing", 100), "a\U00010000");  // ends in two equal bytes
  EXPECT_EQ(TALStemWord(std::string(50000, 'y') + "ing", 100000), std::string(49999, 'y') + 'i');
}
