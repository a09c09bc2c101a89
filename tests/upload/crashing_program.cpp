// A program that crashes, with something to look for in its dump.
#include <cstdio>

namespace {

struct Reading {
  const char* label;
  int value;
};

__attribute__((noinline)) int ValueOf(const Reading* reading) {
  return reading->value;
}

}  // namespace

int main(int argc, char** argv) {
  const Reading first = {argv[argc - 1], 1};
  const Reading* const readings[] = {&first, nullptr};
  int sum = 0;
  for (const Reading* reading : readings) {
    sum += ValueOf(reading);
  }
  printf("%s: %d\n", first.label, sum);
  return 0;
}
