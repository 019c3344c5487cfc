#include "json_fields.h"

#include <cmath>
#include <cstring>
#include <limits>

#include "cli_error.h"

namespace lumo::cli {

using nlohmann::json;

std::string FieldContext::Field(const std::string& name) const {
    return osPath.empty() ? name : osPath + "." + name;
}

FieldContext FieldContext::Child(const std::string& name) const {
    return FieldContext{osSource, Field(name), bBareNames};
}

void FieldContext::Fail(const std::string& name, const std::string& problem) const {
    const std::string field = bBareNames ? Field(name) : "field " + Quoted(Field(name));
    LUMO_CLI_FAIL(osSource + ": " + field + " " + problem);
}

const json* FindField(const json& object, const char* name) {
    const auto it = object.find(name);
    return it == object.end() ? nullptr : &*it;
}

template <typename Json>
const Json& RequireField(const Json& object, const char* name, const FieldContext& ctx) {
    const auto it = object.find(name);
    if (it == object.end()) ctx.Fail(name, "is missing");
    return *it;
}

const json& RequireObjectField(const json& object, const char* name, const FieldContext& ctx) {
    const json& value = RequireField(object, name, ctx);
    if (!value.is_object()) ctx.Fail(name, "must be a JSON object");
    return value;
}

std::string TextValue(const json& value, const std::string& name, const FieldContext& ctx) {
    if (!value.is_string()) ctx.Fail(name, "must be a text, found " + value.dump());
    return value.get<std::string>();
}

std::string GetText(const json& object, const char* name, const FieldContext& ctx) {
    return TextValue(RequireField(object, name, ctx), name, ctx);
}

bool BoolValue(const json& value, const std::string& name, const FieldContext& ctx) {
    if (!value.is_boolean()) ctx.Fail(name, "must be true or false, found " + value.dump());
    return value.get<bool>();
}

bool GetBool(const json& object, const char* name, const FieldContext& ctx) {
    return BoolValue(RequireField(object, name, ctx), name, ctx);
}

namespace {

// The number, or NaN for anything else, so one test refuses both.
double NumberOrNan(const json& value) {
    return value.is_number() ? value.get<double>() : std::numeric_limits<double>::quiet_NaN();
}

}  // namespace

double FiniteValue(const json& value, const std::string& name, const FieldContext& ctx) {
    const double number = NumberOrNan(value);
    if (!std::isfinite(number)) ctx.Fail(name, "must be a finite number, found " + value.dump());
    return number;
}

double GetFiniteNumber(const json& object, const char* name, const FieldContext& ctx) {
    return FiniteValue(RequireField(object, name, ctx), name, ctx);
}

template <typename Json>
bool IntegerInRange(const Json& value, std::int64_t minimum, std::int64_t maximum,
                    std::int64_t* out) {
    if (!value.is_number_integer()) return false;
    // An unsigned value above the signed range lies above any maximum.
    if (value.is_number_unsigned() &&
        value.template get<std::uint64_t>() >
            static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())) {
        return false;
    }
    const auto n = value.template get<std::int64_t>();
    if (n < minimum || n > maximum) return false;
    *out = n;
    return true;
}

template <typename Json>
std::int64_t IntegerValue(const Json& value, const std::string& name, std::int64_t minimum,
                          std::int64_t maximum, const FieldContext& ctx) {
    if (!value.is_number_integer()) ctx.Fail(name, "must be an integer, found " + value.dump());
    std::int64_t n = 0;
    if (!IntegerInRange(value, minimum, maximum, &n)) {
        ctx.Fail(name, "must lie in " + std::to_string(minimum) + ".." + std::to_string(maximum) +
                           ", found " + value.dump());
    }
    return n;
}

int GetInt(const json& object, const char* name, int minimum, int maximum,
           const FieldContext& ctx) {
    return static_cast<int>(
        IntegerValue(RequireField(object, name, ctx), name, minimum, maximum, ctx));
}

namespace {

void CheckArrayShape(const json& value, const char* name, std::size_t count,
                     const FieldContext& ctx, const ArrayFormat& format) {
    const std::string numbers = std::to_string(count) + " numbers";
    if (format.eArray == ArrayWording::kTypeThenLength) {
        if (!value.is_array()) ctx.Fail(name, "must be an array of numbers, found " + value.dump());
        if (value.size() != count) {
            ctx.Fail(name, "must hold " + numbers + format.pszLengthNote + ", found " +
                               std::to_string(value.size()));
        }
        return;
    }
    if (value.is_array() && value.size() == count) return;
    std::string problem = "must be an array of " + numbers;
    if (format.eArray == ArrayWording::kLengthAndValue) {
        problem += ", found " + value.dump();
    } else if (format.eArray == ArrayWording::kLengthAndSize) {
        problem += ", found ";
        problem += value.is_array() ? std::to_string(value.size()) + " items" : value.dump();
    }
    ctx.Fail(name, problem);
}

}  // namespace

void ReadFiniteArray(const json& value, const char* name, std::size_t count, double* target,
                     const FieldContext& ctx, const ArrayFormat& format) {
    CheckArrayShape(value, name, count, ctx, format);
    for (std::size_t k = 0; k < count; ++k) {
        const json& item = value[k];
        const double number = NumberOrNan(item);
        if (!std::isfinite(number)) {
            if (format.eItem == ItemWording::kIndexedField) {
                ctx.Fail(std::string(name) + "[" + std::to_string(k) + "]",
                         "must be a finite number, found " + item.dump());
            }
            ctx.Fail(name, "item " + std::to_string(k) + " must be a finite number, found " +
                               item.dump());
        }
        target[k] = number;
    }
}

void GetFiniteArray(const json& object, const char* name, std::size_t count, double* target,
                    const FieldContext& ctx, const ArrayFormat& format) {
    ReadFiniteArray(RequireField(object, name, ctx), name, count, target, ctx, format);
}

void CopyText(const std::string& text, char* buffer, std::size_t size, const char* name,
              const FieldContext& ctx) {
    if (text.size() >= size) {
        LUMO_CLI_FAIL(ctx.osSource + ": field " + Quoted(ctx.Field(name)) + ": " + Quoted(text) +
                      " is longer than " + std::to_string(size - 1) + " characters");
    }
    std::memcpy(buffer, text.c_str(), text.size() + 1);
}

std::string BufferText(const char* buffer, std::size_t maxLength) {
    return buffer != nullptr ? std::string(buffer, strnlen(buffer, maxLength)) : std::string();
}

ItemLabel ItemOf(const std::string& noun, const std::string& name) {
    return ItemLabel{noun + " ", " of " + Quoted(name)};
}

json FiniteNumberArray(const double* values, int count, const ItemLabel& label) {
    json array = json::array();
    for (int k = 0; k < count; ++k) {
        if (!std::isfinite(values[k])) {
            LUMO_CLI_FAIL("cannot write model: " + label.osBefore + std::to_string(k) +
                          label.osAfter + " is not finite");
        }
        array.push_back(values[k]);
    }
    return array;
}

double FiniteForWrite(double value, const std::string& name) {
    if (!std::isfinite(value)) {
        LUMO_CLI_FAIL("cannot write model: " + Quoted(name) + " is not finite");
    }
    return value;
}

// The readers use plain documents; segment files keep their member order.
template const json& RequireField<json>(const json&, const char*, const FieldContext&);
template const nlohmann::ordered_json& RequireField<nlohmann::ordered_json>(
    const nlohmann::ordered_json&, const char*, const FieldContext&);
template bool IntegerInRange<json>(const json&, std::int64_t, std::int64_t, std::int64_t*);
template bool IntegerInRange<nlohmann::ordered_json>(const nlohmann::ordered_json&, std::int64_t,
                                                     std::int64_t, std::int64_t*);
template std::int64_t IntegerValue<json>(const json&, const std::string&, std::int64_t,
                                         std::int64_t, const FieldContext&);
template std::int64_t IntegerValue<nlohmann::ordered_json>(const nlohmann::ordered_json&,
                                                           const std::string&, std::int64_t,
                                                           std::int64_t, const FieldContext&);

}  // namespace lumo::cli
