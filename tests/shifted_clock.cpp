// Preloaded into a device: the time of day that it sees, shifted by the seconds that stand in a
// file when it asks. That is all that the device knows of the time of day; other clocks stay as
// they are.
#include <cstdio>
#include <cstdlib>
#include <ctime>

extern "C" std::time_t time(std::time_t* result) {
  long shift = 0;
  const char* const name = std::getenv("KAVO_CLOCK_SHIFT");
  if (std::FILE* const file = name == nullptr ? nullptr : std::fopen(name, "re")) {
    if (std::fscanf(file, "%ld", &shift) != 1) {
      shift = 0;
    }
    std::fclose(file);
  }
  timespec now{};
  clock_gettime(CLOCK_REALTIME, &now);
  now.tv_sec += shift;
  if (result != nullptr) {
    *result = now.tv_sec;
  }
  return now.tv_sec;
}
