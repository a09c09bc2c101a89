// The record in which operations on several things report each of them.
#include <memory>

#include "platform/local_account.h"
#include "platform/standalone/error_code.h"
#include "platform/standalone/result_record.h"

ALIBCMRESULT* ALIBCMResultAlloc() try {
  return std::make_unique<ALIBCMRESULT>().release();
} catch (...) {
  platform::FailForException();
  return nullptr;
}

void ALIBCMResultFree(ALIBCMRESULT* result) {
  delete result;
}

const int* ALIBCMResultCoreErrorsGet(ALIBCMRESULT* result) {
  return result == nullptr || result->coreErrors.empty() ? nullptr : result->coreErrors.data();
}
