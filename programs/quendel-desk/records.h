// What the requests of devices change in the database. Each function runs inside a transaction.
#ifndef QUENDEL_DESK_RECORDS_H_
#define QUENDEL_DESK_RECORDS_H_

#include <json/value.h>
#include <soci/soci.h>

#include <optional>
#include <string>
#include <vector>

#include "objects.h"

namespace quendeldesk {

// How a device that nobody has heard of comes in: at once, only when it was entered before, or when
// somebody approves it.
enum class Enrolment { kOpen, kList, kApproval };

// The codes of a refusal, as the devices know them.
constexpr int kAccepted = 0;
constexpr int kNotAllowed = 111000;
constexpr int kUnknownRequest = 111001;
constexpr int kOtherFailure = 119999;

struct Verdict {
  int code = kAccepted;
  std::string message;
};

// Who sends: a heartbeat tells the serial number only.
struct Sender {
  std::string serial;
  std::string field_a;
  std::string field_b;
};

struct Admission {
  Verdict verdict;
  long long device = 0;
  bool is_new = false;  // and therefore to be entered by Admit
};

// Looks whether a device is admitted, without entering it.
Admission LookUp(soci::session& session, const std::string& serial, Enrolment enrolment);
// The same, and enters a new one; under kApproval as one that waits.
Admission Admit(soci::session& session, const std::string& serial, Enrolment enrolment,
                long long now);

// Returns the open actions of a device, as its heartbeat's answer lists them.
Json::Value OpenActions(soci::session& session, long long device, long long now);

Verdict RecordEvent(soci::session& session, const Sender& sender, Enrolment enrolment,
                    const Json::Value& body, long long now);

struct Progress {
  long long request_id = 0;
  long long value = 0;
  std::string details;
};
Verdict RecordProgress(soci::session& session, const Sender& sender, const Progress& progress,
                       long long now);

struct ReceivedFile {
  StoredObject object;
  std::string filename;
  std::string content_type;
};

struct Delivery {
  bool is_upload = false;
  long long request_id = 0;  // of an upload
  std::vector<ReceivedFile> files;
  std::string descriptions;  // as they came
};
Verdict RecordDelivery(soci::session& session, const Sender& sender, Enrolment enrolment,
                       const Delivery& delivery, long long now);

// Compares the descriptions with the files. Returns an empty text when they agree, else a JSON
// object that says what is described and did not come, and what came without a description.
std::string MismatchOf(const Delivery& delivery);

// ---- The supporter's side

struct NewAction {
  std::string name;
  Json::Value body;  // without the request id
  long long expires_at = 0;
};
// Returns the request id. Throws when the device has used all of them.
long long QueueAction(soci::session& session, long long device, const NewAction& action,
                      long long now);
// Returns whether there was such an open action.
bool CancelAction(soci::session& session, long long device, long long requestId, long long now);

// Enters a serial number, or changes whether its device is admitted: "approved", "waiting",
// "refused".
void SetEnrolment(soci::session& session, const std::string& serial, const std::string& enrolment,
                  long long now);

// Makes another pair of account fields the device's own. Returns whether it is one of its pairs.
bool SetOwner(soci::session& session, long long device, long long owner);

// Removes everything that is known of a device but the last request id that was given to it. Its
// objects are discarded: see RemoveDiscarded.
void Forget(soci::session& session, long long device);

// Removes what is older than a moment: heartbeats, events, progress, closed actions, deliveries.
void Prune(soci::session& session, long long before);

bool IsNamed(soci::session& session, const std::string& object);
std::vector<std::string> Discarded(soci::session& session);
void NoteRemoved(soci::session& session, const std::string& object);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_RECORDS_H_
