// The JSON field helpers shared by the tool's file readers: every success
// path, and every failure as a data exception that names the file, the field
// and the offending value (the wording of each message family once).
#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <cstring>
#include <initializer_list>
#include <limits>
#include <string>

#include "json_fields.h"
#include "support/numbered_error.h"

using nlohmann::json;
using nlohmann::ordered_json;
namespace cli = lumo::cli;

namespace {

constexpr double kNan = std::numeric_limits<double>::quiet_NaN();
constexpr double kInf = std::numeric_limits<double>::infinity();

// A call that throws no data exception gives "", which no expected message
// or part matches.
using lumo::support::DataErrorOf;

// `f` fails with a message that holds every one of `parts`.
template <typename F>
void ExpectFailureNaming(F f, std::initializer_list<const char*> parts) {
    const std::string osMessage = DataErrorOf(f);
    for (const char* pszPart : parts) {
        EXPECT_NE(osMessage.find(pszPart), std::string::npos) << osMessage << " / " << pszPart;
    }
}

const cli::FieldContext kTop{"m.json", ""};
const cli::FieldContext kAp{"m.json", "ap"};

TEST(JsonFields, ContextsMembersTextsAndFlags) {
    EXPECT_EQ(DataErrorOf([] { kAp.Child("corrections").Fail("refraction", "is bad"); }),
              "m.json: field \"ap.corrections.refraction\" is bad");
    const cli::FieldContext bare{"b.json", "", true};
    EXPECT_EQ(DataErrorOf([&] { bare.Child("gcps[3]").Fail("pixel", "must be a number"); }),
              "b.json: gcps[3].pixel must be a number");

    const json object = {{"name", "UTM 31"}, {"n", 2}};
    EXPECT_EQ(cli::FindField(object, "absent"), nullptr);
    EXPECT_EQ(cli::RequireField(ordered_json{{"version", 1}}, "version", kTop), 1);
    ExpectFailureNaming([&] { cli::RequireObjectField(object, "n", kTop); }, {"\"n\"", "object"});
    ExpectFailureNaming([&] { cli::GetText(object, "n", kAp); }, {"\"ap.n\"", "found 2"});
    ExpectFailureNaming([&] { cli::GetBool(object, "name", kTop); }, {"\"name\"", "\"UTM 31\""});
}

TEST(JsonFields, NumbersAndIntegersInRange) {
    const json object = {{"i", 7},
                         {"s", "1"},
                         {"nan", kNan},
                         {"inf", -kInf},
                         {"real", 1.5},
                         {"hi", 21},
                         {"huge", std::numeric_limits<std::uint64_t>::max()},
                         {"min64", std::numeric_limits<std::int64_t>::min()}};
    EXPECT_EQ(cli::GetFiniteNumber(object, "i", kTop), 7.0);
    ExpectFailureNaming([&] { cli::GetFiniteNumber(object, "s", kAp); }, {"\"ap.s\"", "\"1\""});
    // A non-finite number has no JSON form and is shown as null.
    for (const char* pszName : {"nan", "inf"}) {
        EXPECT_EQ(DataErrorOf([&] { cli::GetFiniteNumber(object, pszName, kAp); }),
                  "m.json: field \"ap." + std::string(pszName) +
                      "\" must be a finite number, found null");
    }
    EXPECT_EQ(cli::GetInt(object, "hi", -3, 21, kTop), 21);
    ExpectFailureNaming([&] { cli::GetInt(object, "hi", 1, 20, kAp); }, {"\"ap.hi\"", "21"});
    ExpectFailureNaming([&] { cli::GetInt(object, "real", 0, 9, kAp); }, {"integer", "1.5"});
    // Beyond the signed 64-bit range, and at its bottom: refused, not wrapped.
    ExpectFailureNaming(
        [&] { cli::GetInt(object, "huge", 0, std::numeric_limits<int>::max(), kTop); },
        {"18446744073709551615"});
    ExpectFailureNaming([&] { cli::GetInt(object, "min64", -5, 5, kTop); },
                        {"-9223372036854775808"});
    const std::int64_t kMax = std::numeric_limits<std::int64_t>::max();
    std::int64_t n = 0;
    EXPECT_TRUE(cli::IntegerInRange(json(kMax), 0, kMax, &n));
    EXPECT_FALSE(cli::IntegerInRange(json(10), 0, 9, &n));
    EXPECT_EQ(n, kMax);  // untouched on failure
    ExpectFailureNaming([] { cli::IntegerValue(ordered_json(256), "b", 0, 255, kTop); }, {"256"});
}

TEST(JsonFields, ArraysOfFiniteNumbersInEachWording) {
    const json object = {{"short", {1, 2}}, {"text", "1,2,3"}, {"bad", {1, "x", 3}}};
    double out[3] = {0, 0, 0};
    const cli::ArrayFormat aFormats[] = {
        {},
        {cli::ArrayWording::kTypeThenLength, cli::ItemWording::kItemWord, " (nCoeffs)"},
        {cli::ArrayWording::kLengthAndValue, cli::ItemWording::kIndexedField, ""},
        {cli::ArrayWording::kLengthAndSize, cli::ItemWording::kItemWord, ""},
        {cli::ArrayWording::kLengthOnly, cli::ItemWording::kItemWord, ""}};
    for (const cli::ArrayFormat& format : aFormats) {
        for (const char* pszName : {"short", "text", "bad"}) {
            ExpectFailureNaming([&] { cli::GetFiniteArray(object, pszName, 3, out, kAp, format); },
                                {"m.json", pszName});
        }
    }
    EXPECT_EQ(DataErrorOf([&] { cli::GetFiniteArray(object, "bad", 3, out, kAp, aFormats[2]); }),
              "m.json: field \"ap.bad[1]\" must be a finite number, found \"x\"");
}

TEST(JsonFields, TextsInFixedBuffersAndWritingNumbers) {
    char buffer[5];
    cli::CopyText("abcd", buffer, sizeof(buffer), "sensor", kAp);
    EXPECT_STREQ(buffer, "abcd");
    cli::CopyText("", buffer, sizeof(buffer), "sensor", kAp);
    EXPECT_EQ(DataErrorOf([&] { cli::CopyText("abcde", buffer, sizeof(buffer), "sensor", kAp); }),
              "m.json: field \"ap.sensor\": \"abcde\" is longer than 4 characters");
    EXPECT_STREQ(buffer, "");  // a refused text leaves the buffer as it was
    // An unterminated buffer is read up to the limit and never past it.
    const char full[4] = {'a', 'b', 'c', 'd'};
    EXPECT_EQ(cli::BufferText(full, 4), "abcd");
    EXPECT_EQ(cli::BufferText("ab\0cd", 5), "ab");
    EXPECT_EQ(cli::BufferText(nullptr, 8), "");

    // Values survive the trip through text exactly; non-finite ones are refused.
    const double values[4] = {0.1, -1e-300, 6378137.0, 1.0 / 3.0};
    const json array =
        json::parse(cli::FiniteNumberArray(values, 4, cli::ItemOf("item", "x")).dump());
    for (std::size_t k = 0; k < 4; ++k) EXPECT_EQ(array[k].get<double>(), values[k]);
    const double bad[3] = {1.0, 2.0, kNan};
    EXPECT_EQ(DataErrorOf([&] { cli::FiniteNumberArray(bad, 3, cli::ItemOf("item", "tps.cpX")); }),
              "cannot write model: item 2 of \"tps.cpX\" is not finite");
    EXPECT_EQ(cli::FiniteForWrite(-4.25, "xScale"), -4.25);
    ExpectFailureNaming([] { cli::FiniteForWrite(kInf, "xScale"); }, {"\"xScale\""});
}

}  // namespace
