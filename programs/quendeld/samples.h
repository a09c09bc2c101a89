// The series of performance samples that the next collection takes along.
#ifndef QUENDELD_SAMPLES_H_
#define QUENDELD_SAMPLES_H_

#include "context.h"
#include "service.h"

namespace quendeld {

class Samples {
 public:
  Samples(const Context& context, const Service& service);
  void Start();

 private:
  void Take();

  const Context context_;
  const Service& service_;
  Timer timer_;
};

}  // namespace quendeld

#endif  // QUENDELD_SAMPLES_H_
