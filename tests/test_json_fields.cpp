// Tests of the JSON field helpers shared by the tool's file readers: every
// success path and every failure with its exact message.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <string>

#include "json_fields.h"
#include "nova/runtime.h"

using nlohmann::json;
using nlohmann::ordered_json;
namespace cli = lumo::cli;

namespace {

constexpr double kNan = std::numeric_limits<double>::quiet_NaN();
constexpr double kInf = std::numeric_limits<double>::infinity();

// The message of the data exception `f` throws; fails the test when none.
template <typename F>
std::string MessageOf(F f) {
    try {
        f();
    } catch (const nova::DataException& e) {
        return e.what();
    }
    ADD_FAILURE() << "no exception";
    return "";
}

const cli::FieldContext kTop{"m.json", ""};
const cli::FieldContext kAp{"m.json", "ap"};

TEST(JsonFields, ContextNamesFieldsQuotedOrBare) {
    EXPECT_EQ(kTop.Field("geosys"), "geosys");
    EXPECT_EQ(kAp.Child("corrections").Field("refraction"), "ap.corrections.refraction");
    EXPECT_EQ(MessageOf([] { kAp.Child("corrections").Fail("refraction", "is bad"); }),
              "m.json: field \"ap.corrections.refraction\" is bad");
    const cli::FieldContext bare{"b.json", "", true};
    EXPECT_EQ(MessageOf([&] { bare.Fail("the document", "must be an object"); }),
              "b.json: the document must be an object");
    EXPECT_EQ(MessageOf([&] { bare.Child("gcps[3]").Fail("pixel", "must be a number"); }),
              "b.json: gcps[3].pixel must be a number");
}

TEST(JsonFields, MembersTextsAndFlags) {
    const json object = {{"name", "UTM 31"}, {"flag", true}, {"sub", {{"a", 1}}}, {"n", 2}};
    EXPECT_EQ(cli::FindField(object, "absent"), nullptr);
    ASSERT_NE(cli::FindField(object, "n"), nullptr);
    EXPECT_EQ(*cli::FindField(object, "n"), 2);
    EXPECT_EQ(MessageOf([&] { cli::RequireField(object, "absent", kAp); }),
              "m.json: field \"ap.absent\" is missing");
    const ordered_json ordered = {{"version", 1}};
    EXPECT_EQ(cli::RequireField(ordered, "version", kTop), 1);
    EXPECT_EQ(MessageOf([&] { cli::RequireField(ordered, "format", kTop); }),
              "m.json: field \"format\" is missing");

    EXPECT_EQ(cli::RequireObjectField(object, "sub", kTop).at("a"), 1);
    EXPECT_EQ(MessageOf([&] { cli::RequireObjectField(object, "n", kTop); }),
              "m.json: field \"n\" must be a JSON object");

    EXPECT_EQ(cli::GetText(object, "name", kTop), "UTM 31");
    EXPECT_EQ(MessageOf([&] { cli::GetText(object, "n", kAp); }),
              "m.json: field \"ap.n\" must be a text, found 2");
    EXPECT_EQ(MessageOf([&] { cli::GetText(object, "absent", kAp); }),
              "m.json: field \"ap.absent\" is missing");

    EXPECT_TRUE(cli::GetBool(object, "flag", kTop));
    EXPECT_FALSE(cli::BoolValue(json(false), "flag", kTop));
    EXPECT_EQ(MessageOf([&] { cli::GetBool(object, "name", kTop); }),
              "m.json: field \"name\" must be true or false, found \"UTM 31\"");
    EXPECT_EQ(MessageOf([] { cli::BoolValue(json(1), "flag", kAp); }),
              "m.json: field \"ap.flag\" must be true or false, found 1");
}

TEST(JsonFields, FiniteNumbers) {
    const json object = {{"x", -2.5}, {"i", 7}, {"s", "1"}, {"nan", kNan}, {"inf", -kInf}};
    EXPECT_EQ(cli::GetFiniteNumber(object, "x", kTop), -2.5);
    EXPECT_EQ(cli::GetFiniteNumber(object, "i", kTop), 7.0);
    EXPECT_EQ(MessageOf([&] { cli::GetFiniteNumber(object, "s", kAp); }),
              "m.json: field \"ap.s\" must be a finite number, found \"1\"");
    // A non-finite number has no JSON form and is shown as null.
    EXPECT_EQ(MessageOf([&] { cli::GetFiniteNumber(object, "nan", kAp); }),
              "m.json: field \"ap.nan\" must be a finite number, found null");
    EXPECT_EQ(MessageOf([&] { cli::GetFiniteNumber(object, "inf", kAp); }),
              "m.json: field \"ap.inf\" must be a finite number, found null");
    EXPECT_EQ(MessageOf([&] { cli::GetFiniteNumber(object, "y", kAp); }),
              "m.json: field \"ap.y\" is missing");
}

TEST(JsonFields, IntegersInRange) {
    const json object = {{"lo", -3},
                         {"hi", 21},
                         {"real", 1.5},
                         {"text", "4"},
                         {"huge", std::numeric_limits<std::uint64_t>::max()},
                         {"min64", std::numeric_limits<std::int64_t>::min()}};
    EXPECT_EQ(cli::GetInt(object, "lo", -3, 21, kTop), -3);
    EXPECT_EQ(cli::GetInt(object, "hi", -3, 21, kTop), 21);
    EXPECT_EQ(MessageOf([&] { cli::GetInt(object, "hi", 1, 20, kAp); }),
              "m.json: field \"ap.hi\" must lie in 1..20, found 21");
    EXPECT_EQ(MessageOf([&] { cli::GetInt(object, "lo", -2, 20, kAp); }),
              "m.json: field \"ap.lo\" must lie in -2..20, found -3");
    EXPECT_EQ(MessageOf([&] { cli::GetInt(object, "real", 0, 9, kAp); }),
              "m.json: field \"ap.real\" must be an integer, found 1.5");
    EXPECT_EQ(MessageOf([&] { cli::GetInt(object, "text", 0, 9, kAp); }),
              "m.json: field \"ap.text\" must be an integer, found \"4\"");
    // Beyond the signed 64-bit range, and at its bottom: refused, not wrapped.
    EXPECT_EQ(
        MessageOf([&] { cli::GetInt(object, "huge", 0, std::numeric_limits<int>::max(), kTop); }),
        "m.json: field \"huge\" must lie in 0..2147483647, found 18446744073709551615");
    EXPECT_EQ(MessageOf([&] { cli::GetInt(object, "min64", -5, 5, kTop); }),
              "m.json: field \"min64\" must lie in -5..5, found -9223372036854775808");
    EXPECT_EQ(MessageOf([&] { cli::GetInt(object, "none", 0, 1, kTop); }),
              "m.json: field \"none\" is missing");

    const std::int64_t kMax = std::numeric_limits<std::int64_t>::max();
    std::int64_t n = 0;
    EXPECT_TRUE(cli::IntegerInRange(json(kMax), 0, kMax, &n));
    EXPECT_EQ(n, kMax);
    EXPECT_FALSE(cli::IntegerInRange(object.at("huge"), 0, kMax, &n));
    EXPECT_FALSE(cli::IntegerInRange(json(2.0), 0, 9, &n));
    EXPECT_FALSE(cli::IntegerInRange(json(10), 0, 9, &n));
    EXPECT_EQ(n, kMax);  // untouched on failure
    EXPECT_EQ(cli::IntegerValue(ordered_json(255), "b", 0, 255, kTop), 255);
    EXPECT_EQ(MessageOf([] { cli::IntegerValue(ordered_json(256), "b", 0, 255, kTop); }),
              "m.json: field \"b\" must lie in 0..255, found 256");
}

TEST(JsonFields, ArraysOfFiniteNumbersInEachWording) {
    const json object = {{"ok", {1.5, -2, 3e10}},
                         {"short", {1, 2}},
                         {"text", "1,2,3"},
                         {"bad", {1, "x", 3}},
                         {"nan", {1, 2, kNan}}};
    double out[3] = {0, 0, 0};
    cli::GetFiniteArray(object, "ok", 3, out, kTop);
    EXPECT_EQ(out[0], 1.5);
    EXPECT_EQ(out[1], -2.0);
    EXPECT_EQ(out[2], 3e10);
    cli::GetFiniteArray(json{{"none", json::array()}}, "none", 0, nullptr, kTop);

    const cli::ArrayFormat typeThenLength{};
    const cli::ArrayFormat withNote{cli::ArrayWording::kTypeThenLength, cli::ItemWording::kItemWord,
                                    " (nCoeffs)"};
    const cli::ArrayFormat lengthAndValue{cli::ArrayWording::kLengthAndValue,
                                          cli::ItemWording::kIndexedField, ""};
    const cli::ArrayFormat lengthAndSize{cli::ArrayWording::kLengthAndSize,
                                         cli::ItemWording::kItemWord, ""};
    const cli::ArrayFormat lengthOnly{cli::ArrayWording::kLengthOnly, cli::ItemWording::kItemWord,
                                      ""};
    auto message = [&](const char* name, const cli::ArrayFormat& format) {
        return MessageOf([&] { cli::GetFiniteArray(object, name, 3, out, kAp, format); });
    };
    EXPECT_EQ(message("absent", typeThenLength), "m.json: field \"ap.absent\" is missing");

    EXPECT_EQ(message("text", typeThenLength),
              "m.json: field \"ap.text\" must be an array of numbers, found \"1,2,3\"");
    EXPECT_EQ(message("short", typeThenLength),
              "m.json: field \"ap.short\" must hold 3 numbers, found 2");
    EXPECT_EQ(message("short", withNote),
              "m.json: field \"ap.short\" must hold 3 numbers (nCoeffs), found 2");

    EXPECT_EQ(message("text", lengthAndValue),
              "m.json: field \"ap.text\" must be an array of 3 numbers, found \"1,2,3\"");
    EXPECT_EQ(message("short", lengthAndValue),
              "m.json: field \"ap.short\" must be an array of 3 numbers, found [1,2]");

    EXPECT_EQ(message("text", lengthAndSize),
              "m.json: field \"ap.text\" must be an array of 3 numbers, found \"1,2,3\"");
    EXPECT_EQ(message("short", lengthAndSize),
              "m.json: field \"ap.short\" must be an array of 3 numbers, found 2 items");

    EXPECT_EQ(message("text", lengthOnly),
              "m.json: field \"ap.text\" must be an array of 3 numbers");
    EXPECT_EQ(message("short", lengthOnly),
              "m.json: field \"ap.short\" must be an array of 3 numbers");

    EXPECT_EQ(message("bad", typeThenLength),
              "m.json: field \"ap.bad\" item 1 must be a finite number, found \"x\"");
    EXPECT_EQ(message("nan", lengthOnly),
              "m.json: field \"ap.nan\" item 2 must be a finite number, found null");
    EXPECT_EQ(message("bad", lengthAndValue),
              "m.json: field \"ap.bad[1]\" must be a finite number, found \"x\"");
    EXPECT_EQ(message("nan", lengthAndValue),
              "m.json: field \"ap.nan[2]\" must be a finite number, found null");
}

TEST(JsonFields, TextsInFixedBuffers) {
    char buffer[5];
    std::memset(buffer, 'x', sizeof(buffer));
    cli::CopyText("abcd", buffer, sizeof(buffer), "sensor", kAp);
    EXPECT_STREQ(buffer, "abcd");
    cli::CopyText("", buffer, sizeof(buffer), "sensor", kAp);
    EXPECT_STREQ(buffer, "");
    EXPECT_EQ(MessageOf([&] { cli::CopyText("abcde", buffer, sizeof(buffer), "sensor", kAp); }),
              "m.json: field \"ap.sensor\": \"abcde\" is longer than 4 characters");
    EXPECT_EQ(MessageOf([&] { cli::CopyText("UTM 31 U", buffer, sizeof(buffer), "geosys", kTop); }),
              "m.json: field \"geosys\": \"UTM 31 U\" is longer than 4 characters");
    EXPECT_STREQ(buffer, "");  // a refused text leaves the buffer as it was

    // An unterminated buffer is read up to the limit and never past it.
    const char full[4] = {'a', 'b', 'c', 'd'};
    EXPECT_EQ(cli::BufferText(full, 4), "abcd");
    EXPECT_EQ(cli::BufferText(full, 3), "abc");
    EXPECT_EQ(cli::BufferText("ab\0cd", 5), "ab");
    EXPECT_EQ(cli::BufferText(nullptr, 8), "");
}

TEST(JsonFields, WritingFiniteNumbers) {
    // Values survive the trip through text exactly.
    const double values[4] = {0.1, -1e-300, 6378137.0, 1.0 / 3.0};
    const json array =
        json::parse(cli::FiniteNumberArray(values, 4, cli::ItemOf("item", "x")).dump());
    ASSERT_EQ(array.size(), 4U);
    for (std::size_t k = 0; k < 4; ++k) EXPECT_EQ(array[k].get<double>(), values[k]);
    EXPECT_TRUE(cli::FiniteNumberArray(values, 0, cli::ItemOf("item", "x")).empty());

    const double bad[3] = {1.0, 2.0, kNan};
    EXPECT_EQ(MessageOf([&] { cli::FiniteNumberArray(bad, 3, cli::ItemOf("item", "tps.cpX")); }),
              "cannot write model: item 2 of \"tps.cpX\" is not finite");
    EXPECT_EQ(
        MessageOf([&] { cli::FiniteNumberArray(bad, 3, cli::ItemOf("coefficient", "xCoeffs")); }),
        "cannot write model: coefficient 2 of \"xCoeffs\" is not finite");
    EXPECT_EQ(MessageOf([&] {
                  cli::FiniteNumberArray(bad, 3, cli::ItemLabel{"\"radial\" item ", ""});
              }),
              "cannot write model: \"radial\" item 2 is not finite");
    EXPECT_EQ(cli::FiniteForWrite(-4.25, "xScale"), -4.25);
    EXPECT_EQ(MessageOf([] { cli::FiniteForWrite(kInf, "xScale"); }),
              "cannot write model: \"xScale\" is not finite");
}

}  // namespace
