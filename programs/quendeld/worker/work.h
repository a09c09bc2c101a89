// The pieces of work that the daemon hands to a worker. Each takes the request's members and
// returns those of the answer, of which "result" is 0 for success and -1 for failure.
//
// Whatever talks to the server looks first whether the service is enabled, and answers
// {"result": -1, "disabled": true} when it is not.
#ifndef QUENDEL_WORKER_WORK_H_
#define QUENDEL_WORKER_WORK_H_

#include <json/value.h>

namespace quendel_worker {

// "facts": what the device is and how its service is switched.
Json::Value TellFacts(const Json::Value& request);

// "look": the facts, the state of each collected log, and the outbox.
Json::Value Look(const Json::Value& request);

// "heartbeat": sends one and returns the server's "actions"; and "facts" as above.
Json::Value SendHeartbeat(const Json::Value& request);

// "report": sends the progress of each of "reports", a list of {"id", "progress"}; "accepted" is
// the list of the ids that the server accepted. It stops at the first that it did not.
Json::Value SendReports(const Json::Value& request);

// "event": sends "event", a number, with "info". "answered" tells whether the server said anything.
Json::Value SendEvent(const Json::Value& request);

// "sample": asks for the performance figures; "sample" is one of a series.
Json::Value TakeSample(const Json::Value& request);

// "collect": a collection run, see collect_work.cpp.
Json::Value Collect(const Json::Value& request);

// "send_outbox": sends the oldest archive of the outbox and removes it.
Json::Value SendOutbox(const Json::Value& request);

// "tidy": removes what dead runs and uploads left.
Json::Value Tidy(const Json::Value& request);

// "upload": carries out the request "id" for "files".
Json::Value Upload(const Json::Value& request);

// "remote_close": ends the support session for the request "id" with "progress". "no_session" is
// true when there was none.
Json::Value CloseRemote(const Json::Value& request);

// "stopping": what the system is about to do: "why" is "poweroff", "reboot" or empty.
Json::Value TellWhyStopping(const Json::Value& request);

// "power": has the system do what "kind" says, "poweroff" or "reboot".
Json::Value SwitchPower(const Json::Value& request);

// The answers that several give.
Json::Value Failed();
Json::Value Disabled();

}  // namespace quendel_worker

#endif  // QUENDEL_WORKER_WORK_H_
