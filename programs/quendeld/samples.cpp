#include "samples.h"

#include "json.h"

namespace quendeld {

Samples::Samples(const Context& context, const Service& service)
    : context_(context), service_(service), timer_(context.loop, [this] { Take(); }) {
}

void Samples::Start() {
  timer_.Start(context_.settings.sample_interval);
}

void Samples::Take() {
  Start();
  if (!service_.MayTalk() || !context_.workers.IsIdle(Lane::kLocal)) {
    return;
  }
  context_.workers.Submit(
      Lane::kLocal,
      {"sample", Json::objectValue, context_.settings.local_limit, [this](const WorkerEnd& end) {
         if (end.Succeeded()) {
           context_.journal.AddSample(Member(end.answer, "sample"), context_.settings.samples_kept);
         }
       }});
}

}  // namespace quendeld
