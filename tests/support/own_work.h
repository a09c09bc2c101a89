// Tells the kit's own work from that of what is tested, which it goes on in the middle of.
#ifndef TESTS_SUPPORT_OWN_WORK_H_
#define TESTS_SUPPORT_OWN_WORK_H_

namespace quendel::test {

// The calling thread does work of the kit while one of these lives. Its calls are not counted, and
// neither they nor its allocations fail.
class OwnWork {
 public:
  OwnWork() { ++depth; }
  ~OwnWork() { --depth; }
  OwnWork(const OwnWork&) = delete;
  OwnWork& operator=(const OwnWork&) = delete;

  static bool goes_on() { return depth > 0; }

 private:
  static inline thread_local int depth = 0;
};

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_OWN_WORK_H_
