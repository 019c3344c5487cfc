// Field access shared by the tool's JSON file readers and writers. Every
// failure throws nova::DataException whose message names the file, the field
// and the offending value. The readers' messages differ in places that tests
// and users rely on, so the helpers take the wording as a parameter rather
// than imposing one.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

#include <nlohmann/json.hpp>

namespace lumo::cli {

// Where fields are read: the file and the path of the enclosing object
// ("" at the top level, "ap", "tps.geoToImage", "images[2]").
struct FieldContext {
    std::string osSource;
    std::string osPath;
    // Messages say `file: path problem` rather than `file: field "path" problem`.
    bool bBareNames = false;

    // The path of a member: "name" at the top level, else "path.name".
    std::string Field(const std::string& name) const;
    // The context of the member object `name`.
    FieldContext Child(const std::string& name) const;
    [[noreturn]] void Fail(const std::string& name, const std::string& problem) const;
};

// ---------------------------------------------------------------------------
// Reading
// ---------------------------------------------------------------------------

// The member, or null when absent.
const nlohmann::json* FindField(const nlohmann::json& object, const char* name);

// The member; "is missing" when absent. (Also for ordered documents.)
template <typename Json>
const Json& RequireField(const Json& object, const char* name, const FieldContext& ctx);

// The member, which must be an object: "must be a JSON object".
const nlohmann::json& RequireObjectField(const nlohmann::json& object, const char* name,
                                         const FieldContext& ctx);

// A text: "must be a text, found <value>".
std::string TextValue(const nlohmann::json& value, const std::string& name,
                      const FieldContext& ctx);
std::string GetText(const nlohmann::json& object, const char* name, const FieldContext& ctx);

// true or false: "must be true or false, found <value>".
bool BoolValue(const nlohmann::json& value, const std::string& name, const FieldContext& ctx);
bool GetBool(const nlohmann::json& object, const char* name, const FieldContext& ctx);

// A finite number: "must be a finite number, found <value>".
double FiniteValue(const nlohmann::json& value, const std::string& name, const FieldContext& ctx);
double GetFiniteNumber(const nlohmann::json& object, const char* name, const FieldContext& ctx);

// True when `value` is an integer in minimum..maximum, stored in *out;
// for readers that word the failure themselves.
template <typename Json>
bool IntegerInRange(const Json& value, std::int64_t minimum, std::int64_t maximum,
                    std::int64_t* out);

// An integer in minimum..maximum: "must be an integer, found <value>", or
// "must lie in <minimum>..<maximum>, found <value>".
template <typename Json>
std::int64_t IntegerValue(const Json& value, const std::string& name, std::int64_t minimum,
                          std::int64_t maximum, const FieldContext& ctx);
int GetInt(const nlohmann::json& object, const char* name, int minimum, int maximum,
           const FieldContext& ctx);

// How an array of the wrong type or length is described.
enum class ArrayWording {
    // "must be an array of numbers, found <value>", then
    // "must hold <count> numbers<note>, found <length>"
    kTypeThenLength,
    // "must be an array of <count> numbers, found <value>"
    kLengthAndValue,
    // as kLengthAndValue, but "found <length> items" for an array
    kLengthAndSize,
    // "must be an array of <count> numbers"
    kLengthOnly,
};

// How an item that is not a finite number is named.
enum class ItemWording {
    kItemWord,      // field "name": "item <k> must be a finite number, found <value>"
    kIndexedField,  // field "name[<k>]": "must be a finite number, found <value>"
};

struct ArrayFormat {
    ArrayWording eArray = ArrayWording::kTypeThenLength;
    ItemWording eItem = ItemWording::kItemWord;
    const char* pszLengthNote = "";  // after "<count> numbers" with kTypeThenLength
};

// Exactly `count` finite numbers into target[0..count).
void ReadFiniteArray(const nlohmann::json& value, const char* name, std::size_t count,
                     double* target, const FieldContext& ctx, const ArrayFormat& format = {});
void GetFiniteArray(const nlohmann::json& object, const char* name, std::size_t count,
                    double* target, const FieldContext& ctx, const ArrayFormat& format = {});

// Copies `text` with its terminator into a record buffer of `size` bytes; a
// longer text is refused rather than cut, as the file should say what the
// model holds: `file: field "name": "<text>" is longer than <size-1> characters`.
void CopyText(const std::string& text, char* buffer, std::size_t size, const char* name,
              const FieldContext& ctx);

// ---------------------------------------------------------------------------
// Writing
// ---------------------------------------------------------------------------

// The text of a record buffer, at most maxLength characters: the buffer need
// not be terminated within its size, and is never read past it. Null gives "".
std::string BufferText(const char* buffer, std::size_t maxLength);

// Names item k of an array being written: osBefore + k + osAfter.
struct ItemLabel {
    std::string osBefore;
    std::string osAfter;
};
// `noun k of "name"`, e.g. `item 3 of "cpX"`.
ItemLabel ItemOf(const std::string& noun, const std::string& name);

// The numbers as a JSON array: "cannot write model: <label> is not finite".
nlohmann::json FiniteNumberArray(const double* values, int count, const ItemLabel& label);

// The number, when finite: `cannot write model: "name" is not finite`.
double FiniteForWrite(double value, const std::string& name);

}  // namespace lumo::cli
