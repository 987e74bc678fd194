// How many distinct TZIDs of a set of .ics files the importer resolves to a zone of the
// time-zone database. Reads the files named on the command line (see
// scripts/ical_zone_census.sh, which runs it over the development corpus in ../shared).
// With -v, prints each TZID and what it became.

#include <libical/ical.h>

#include <fstream>
#include <iostream>
#include <map>
#include <sstream>
#include <string>

#include "importers/ical_time_zones.h"

namespace {

void collectParameters(icalcomponent* component, std::map<std::string, std::string>& seen,
                       tessel::importers::ICalTimeZones& zones) {
  for (icalproperty* property = icalcomponent_get_first_property(component, ICAL_ANY_PROPERTY);
       property != nullptr;
       property = icalcomponent_get_next_property(component, ICAL_ANY_PROPERTY)) {
    icalparameter* tzid = icalproperty_get_first_parameter(property, ICAL_TZID_PARAMETER);
    const char* name = tzid != nullptr ? icalparameter_get_tzid(tzid) : nullptr;
    if (name == nullptr) continue;
    std::string& result = seen[name];
    if (!result.empty() && result != "-") continue;
    const auto zone = zones.zone(name);
    result = !zone ? "-" : zone->name().value_or("unnamed " + zone->description());
  }
  for (icalcomponent* child = icalcomponent_get_first_component(component, ICAL_ANY_COMPONENT);
       child != nullptr; child = icalcomponent_get_next_component(component, ICAL_ANY_COMPONENT)) {
    if (icalcomponent_isa(child) != ICAL_VTIMEZONE_COMPONENT) collectParameters(child, seen, zones);
  }
}

}  // namespace

int main(int argc, char** argv) {
  bool verbose = false;
  std::map<std::string, std::string> seen;
  for (int i = 1; i < argc; ++i) {
    if (std::string(argv[i]) == "-v") {
      verbose = true;
      continue;
    }
    std::ifstream in(argv[i], std::ios::binary);
    std::stringstream text;
    text << in.rdbuf();
    icalcomponent* root = icalparser_parse_string(text.str().c_str());
    if (root == nullptr) continue;
    if (icalcomponent_isa(root) == ICAL_VCALENDAR_COMPONENT) {
      tessel::importers::ICalTimeZones zones(root);
      collectParameters(root, seen, zones);
    } else {
      for (icalcomponent* c = icalcomponent_get_first_component(root, ICAL_VCALENDAR_COMPONENT);
           c != nullptr; c = icalcomponent_get_next_component(root, ICAL_VCALENDAR_COMPONENT)) {
        tessel::importers::ICalTimeZones zones(c);
        collectParameters(c, seen, zones);
      }
    }
    icalcomponent_free(root);
  }
  std::size_t named = 0;
  for (const auto& [tzid, result] : seen) {
    const bool isNamed = result != "-" && result.rfind("unnamed ", 0) != 0;
    named += isNamed ? 1 : 0;
    if (verbose) std::cout << tzid << "\t" << result << "\n";
  }
  std::cout << named << " of " << seen.size() << " distinct TZIDs resolve to a named zone\n";
  return 0;
}
