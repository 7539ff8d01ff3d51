#pragma once

#include <fmt/format.h>

#include <string_view>

#include "foundation/Data.h"
#include "foundation/Date.h"
#include "foundation/Description.h"
#include "foundation/Error.h"
#include "foundation/Key.h"
#include "foundation/String.h"
#include "foundation/UUID.h"
#include "foundation/Value.h"

// Lets fmt write our values as their descriptions, so that a log line costs nothing when its level is off. Width and
// alignment work as for text.
namespace telvane::formatting {

template <class T>
struct TextFormatter : fmt::formatter<std::string_view> {
  template <class Context>
  auto format(const T& text, Context& context) const {
    return fmt::formatter<std::string_view>::format(text.view(), context);
  }
};

template <class T>
struct ContainerFormatter : fmt::formatter<std::string_view> {
  template <class Context>
  auto format(const T& value, Context& context) const {
    return fmt::formatter<std::string_view>::format(telvane::description(value), context);
  }
};

template <class T>
struct DescriptionFormatter : fmt::formatter<std::string_view> {
  template <class Context>
  auto format(const T& value, Context& context) const {
    return fmt::formatter<std::string_view>::format(value.description(), context);
  }
};

}  // namespace telvane::formatting

template <>
struct fmt::formatter<telvane::String> : telvane::formatting::TextFormatter<telvane::String> {};
template <>
struct fmt::formatter<telvane::Key> : telvane::formatting::TextFormatter<telvane::Key> {};
template <>
struct fmt::formatter<telvane::Value> : telvane::formatting::ContainerFormatter<telvane::Value> {};
template <>
struct fmt::formatter<telvane::Array> : telvane::formatting::ContainerFormatter<telvane::Array> {};
template <>
struct fmt::formatter<telvane::Dictionary> : telvane::formatting::ContainerFormatter<telvane::Dictionary> {};
template <>
struct fmt::formatter<telvane::Data> : telvane::formatting::DescriptionFormatter<telvane::Data> {};
template <>
struct fmt::formatter<telvane::Date> : telvane::formatting::DescriptionFormatter<telvane::Date> {};
template <>
struct fmt::formatter<telvane::Error> : telvane::formatting::DescriptionFormatter<telvane::Error> {};
template <>
struct fmt::formatter<telvane::UUID> : fmt::formatter<std::string_view> {
  template <class Context>
  auto format(const telvane::UUID& uuid, Context& context) const {
    return fmt::formatter<std::string_view>::format(uuid.string(), context);
  }
};
