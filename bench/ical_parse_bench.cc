// libical's parse of one .ics file, the peer of `tessel import ical` in bench/scale: reads
// the file, parses it with icalparser_parse_string, counts the events and frees the tree.
// Prints "events N seconds S" (the parse alone); the peak memory is measured from outside.
#include <libical/ical.h>

#include <chrono>
#include <cstdio>
#include <fstream>
#include <sstream>
#include <string>

int main(int argc, char** argv) {
  if (argc != 2) {
    std::fprintf(stderr, "usage: ical_parse_bench FILE.ics\n");
    return 2;
  }
  std::ifstream in(argv[1], std::ios::binary);
  std::ostringstream text;
  text << in.rdbuf();
  const std::string bytes = text.str();
  const auto start = std::chrono::steady_clock::now();
  icalcomponent* calendar = icalparser_parse_string(bytes.c_str());
  if (calendar == nullptr) return 1;
  int events = 0;
  for (icalcomponent* event = icalcomponent_get_first_component(calendar, ICAL_VEVENT_COMPONENT);
       event != nullptr;
       event = icalcomponent_get_next_component(calendar, ICAL_VEVENT_COMPONENT)) {
    ++events;
  }
  const double seconds =
      std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
  icalcomponent_free(calendar);
  std::printf("events %d seconds %.3f\n", events, seconds);
  return 0;
}
