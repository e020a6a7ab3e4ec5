/// @file
/// Reads and checks the options that a plug-in is given.
#ifndef BRENIXCORE_PLUGIN_OPTIONS_HPP
#define BRENIXCORE_PLUGIN_OPTIONS_HPP

#include "brenixcore/plugin/Visit.hpp"
#include "brenixplugin/Property.hpp"

#include <cmath>
#include <optional>
#include <set>
#include <stdexcept>
#include <string>
#include <type_traits>

namespace brenixcore::plugin
{

/// The options of one call. Every error is a std::invalid_argument "Option <name>: <what is
/// wrong>."
class Options
{
public:
    /// Reads from the map, which must outlive this object.
    explicit Options(const brenixplugin::PropertyMap& optionMap) : options(optionMap) {}

    /// A text. Options carry it as one UTF-16 code unit for each byte of the caller's text.
    std::optional<std::string> text(const std::string& name)
    {
        auto* const property = find(name);
        if (property == nullptr) {
            return std::nullopt;
        }
        const auto* const scalar =
            dynamic_cast<brenixplugin::kit::device::TScalarProperty<std::u16string>*>(property);
        if (scalar == nullptr) {
            fail(name, "must be a text");
        }
        std::string result;
        for (const char16_t unit : scalar->value) {
            result += static_cast<char>(unit & 0xFF);
        }
        return result;
    }

    /// One number of any numeric type.
    std::optional<double> number(const std::string& name) { return readNumber(name).value; }

    /// One whole number in a range. An integer is taken to its last digit.
    std::optional<long> wholeNumber(const std::string& name, long least, long most)
    {
        const auto [value, integer] = readNumber(name);
        if (!value) {
            return std::nullopt;
        }
        const double beyond = 0x1p63; // the last in this range is no double
        if (!(*value >= static_cast<double>(least) && *value <= static_cast<double>(most)) ||
            *value >= beyond || std::floor(*value) != *value) {
            fail(name, "must be a whole number from " + std::to_string(least) + " to " +
                           std::to_string(most));
        }
        return integer.value_or(static_cast<long>(*value));
    }

    /// True or false: "logical", or the number 1 or 0.
    std::optional<bool> logical(const std::string& name)
    {
        auto* const property = find(name);
        if (property == nullptr) {
            return std::nullopt;
        }
        if (const auto* const scalar =
                dynamic_cast<brenixplugin::kit::device::TScalarProperty<bool>*>(property)) {
            return scalar->value;
        }
        ReadScalar reader;
        visitNumbers(property, reader);
        if (reader.value != 0.0 && reader.value != 1.0) {
            fail(name, "must be true or false");
        }
        return *reader.value == 1;
    }

    /// Refuses options that were not asked for.
    void requireAllKnown() const
    {
        for (const auto& option : options) {
            if (asked.find(option.first) == asked.end()) {
                fail(option.first, "is not known");
            }
        }
    }

    /// Throws the error.
    [[noreturn]] static void fail(const std::string& name, const std::string& problem)
    {
        throw std::invalid_argument("Option " + name + ": " + problem + ".");
    }

private:
    struct ReadScalar {
        template <typename T>
        void operator()(const brenixplugin::kit::device::TScalarProperty<T>& scalar)
        {
            value = static_cast<double>(scalar.value);
            if constexpr (std::is_integral_v<T>) {
                integer = static_cast<long>(scalar.value);
            }
        }
        template <typename Other>
        void operator()(const Other& /*several*/)
        {
        }
        std::optional<double> value;
        std::optional<long> integer; ///< the same; wraps beyond its range
    };

    ReadScalar readNumber(const std::string& name)
    {
        ReadScalar reader;
        if (auto* const property = find(name); property != nullptr) {
            visitNumbers(property, reader);
            if (!reader.value || std::isnan(*reader.value)) {
                fail(name, "must be one number");
            }
        }
        return reader;
    }

    brenixplugin::interfaces::IPropertyInfo* find(const std::string& name)
    {
        asked.insert(name);
        const auto found = options.find(name);
        return found == options.end() ? nullptr : brenixplugin::asProperty(found->second);
    }

    const brenixplugin::PropertyMap& options;
    std::set<std::string> asked;
};

} // namespace brenixcore::plugin

#endif
