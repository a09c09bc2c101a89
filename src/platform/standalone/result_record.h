// What the result record is made of, for the operations that fill it.
#ifndef PLATFORM_STANDALONE_RESULT_RECORD_H_
#define PLATFORM_STANDALONE_RESULT_RECORD_H_

#include <vector>

struct ALIBCMRESULT {
  std::vector<int> coreErrors;
};

#endif  // PLATFORM_STANDALONE_RESULT_RECORD_H_
