#include "importers/ical_properties.h"

#include <cstdlib>
#include <memory>

namespace tessel::importers::ical {

namespace {

struct FreeText {
  void operator()(char* text) const { std::free(text); }
};

}  // namespace

std::vector<icalproperty*> propertiesOf(icalcomponent* component) {
  std::vector<icalproperty*> properties;
  for (icalproperty* property = icalcomponent_get_first_property(component, ICAL_ANY_PROPERTY);
       property != nullptr;
       property = icalcomponent_get_next_property(component, ICAL_ANY_PROPERTY)) {
    properties.push_back(property);
  }
  return properties;
}

std::vector<icalcomponent*> componentsOf(icalcomponent* component, icalcomponent_kind kind) {
  std::vector<icalcomponent*> components;
  for (icalcompiter it = icalcomponent_begin_component(component, kind);
       icalcompiter_deref(&it) != nullptr; icalcompiter_next(&it)) {
    components.push_back(icalcompiter_deref(&it));
  }
  return components;
}

std::optional<std::string> parameter(icalproperty* property, const char* name) {
  std::unique_ptr<char, FreeText> value(icalproperty_get_parameter_as_string_r(property, name));
  if (!value) return std::nullopt;
  std::string text;
  for (const char* c = value.get(); *c != '\0'; ++c) {
    if (*c != '"') text += *c;
  }
  return text;
}

std::string valueText(icalproperty* property) {
  std::unique_ptr<char, FreeText> value(icalproperty_get_value_as_string_r(property));
  return value ? std::string(value.get()) : std::string();
}

std::optional<std::string> text(const char* value) {
  if (value == nullptr || *value == '\0') return std::nullopt;
  return std::string(value);
}

std::int64_t durationSeconds(const icaldurationtype& d) {
  const std::int64_t seconds = (std::int64_t{d.weeks} * 7 + d.days) * 86400 +
                               std::int64_t{d.hours} * 3600 + std::int64_t{d.minutes} * 60 +
                               d.seconds;
  return d.is_neg ? -seconds : seconds;
}

}  // namespace tessel::importers::ical
