// What the store keeps and requests bring must come back as it went out, byte by byte.
#include "device/base/json_text.h"

#include <gtest/gtest.h>

#include <stdexcept>
#include <string>

namespace {

using Device::ParseJson;
using Device::ToText;

TEST(JsonTextTest, GoesOutAsItCameIn) {
  for (const char* text :
       {"null", "[]", "{}", "-9223372036854775808", "18446744073709551615", "0.5",
        "0.28999999165534973", R"(["",true,[false,{"a":{},"b":[1,-1]}]])",
        R"("\u0000\u001f\b\f\n\r\t\"\\/")", "\"\x80\xff\xed\xa0\x80 \xc3\xa9\x7f\"",
        R"({"":1,"k\u0000":2,"é":3})"}) {
    EXPECT_EQ(ToText(ParseJson(text)), text);
  }
  EXPECT_EQ(ToText(ParseJson(" [ \"\\u00e9\\ud83d\\ude00\" , 1.0 ]\n")), "[\"é😀\",1.0]");
}

TEST(JsonTextTest, NumbersHaveTheTypesOfValuesMadeInTheProgram) {
  EXPECT_EQ(ParseJson("5"), Json::Value(5));
  EXPECT_EQ(ParseJson("3000000000"), Json::Value(Json::Int64{3000000000}));
  EXPECT_EQ(ParseJson("9223372036854775807").type(), Json::intValue);
  EXPECT_EQ(ParseJson("9223372036854775808").type(), Json::uintValue);
  EXPECT_EQ(ParseJson("184467440737095516159223372036854775808").asDouble(),
            184467440737095516159223372036854775808.0);
  for (const double number : {0.1, 1e-300, 1.7976931348623157e308, 5e-324, 0.28999999165534973}) {
    EXPECT_EQ(ParseJson(ToText(number)).asDouble(), number);
  }
}

TEST(JsonTextTest, WhatIsNoJsonIsRefusedWithItsPlace) {
  struct Row {
    std::string text;
    const char* place;
  };
  for (const auto& [text, place] :
       {Row{"", "line 1, column 1: "}, Row{"[1]\n 2", "line 2, column 2: "},
        Row{"[1,\n]", "line 2, column 1: "}, Row{"[1] // one", "line 1, column 5: "},
        Row{"{\"a\":1,\n\"a\":2}", "line 2, column 1: Duplicate key: 'a'"},
        Row{R"("\ud800")", "line 1, column 1: "},
        Row{std::string("[1]\0]", 5), "line 1, column 4: "}, Row{"NaN", "line 1, column 1: "},
        Row{"[1,922337203685477581e308]", "line 1, column "}, Row{"-1e400", "line 1, column "},
        Row{"[[[1]]]", "line 1, column 3: nested too deep"}}) {
    try {
      ParseJson(text, 2);
      ADD_FAILURE() << text;
    } catch (const std::runtime_error& error) {
      EXPECT_EQ(std::string(error.what()).rfind(place, 0), 0U) << text << ": " << error.what();
    }
  }
}

}  // namespace
