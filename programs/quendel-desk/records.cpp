// What the requests of devices change in the database.
#include "records.h"

#include <algorithm>
#include <map>
#include <stdexcept>

#include "crypto.h"
#include "json.h"

namespace quendeldesk {
namespace {

using soci::into;
using soci::use;

constexpr long long kLastRequestId = 9'999'999;  // an eighth digit would be cut off on the device
constexpr int kMostActionsInAnAnswer = 100;

long long InsertDevice(soci::session& session, const std::string& serial,
                       const std::string& enrolment, long long now) {
  long long id = 0;
  session << "INSERT INTO devices (serial, enrolment, first_seen, last_seen, last_heartbeat,"
             " owner_id, version, email, info) VALUES (:serial, :enrolment, :first, :last, 0, 0,"
             " '', '', '') RETURNING id",
      use(serial, "serial"), use(enrolment, "enrolment"), use(now, "first"), use(now, "last"),
      into(id);
  return id;
}

// Returns the number of the sender's pair of account fields. The device's first pair is its own.
long long OwnerOf(soci::session& session, long long device, const Sender& sender, long long now) {
  long long owner = 0;
  session << "INSERT INTO owners (device_id, field_a, field_b, first_seen, last_seen)"
             " VALUES (:device, :a, :b, :first, :last)"
             " ON CONFLICT (device_id, field_a, field_b) DO UPDATE SET last_seen ="
             " excluded.last_seen RETURNING id",
      use(device, "device"), use(sender.field_a, "a"), use(sender.field_b, "b"), use(now, "first"),
      use(now, "last"), into(owner);
  session << "UPDATE devices SET owner_id = :owner WHERE id = :device AND owner_id = 0",
      use(owner, "owner"), use(device, "device");
  session << "UPDATE devices SET last_seen = :now WHERE id = :device", use(now, "now"),
      use(device, "device");
  return owner;
}

bool IsOwnOwner(soci::session& session, long long device, long long owner) {
  long long own = 0;
  session << "SELECT owner_id FROM devices WHERE id = :device", use(device, "device"), into(own);
  return own == owner;
}

bool IsAction(soci::session& session, long long device, long long requestId) {
  int count = 0;
  session << "SELECT COUNT(*) FROM actions WHERE device_id = :device AND request_id = :id",
      use(device, "device"), use(requestId, "id"), into(count);
  return count > 0;
}

// Changes an action that is open, expired or not: a device may be late. Returns whether it was.
bool CloseAction(soci::session& session, long long device, long long requestId, const char* state,
                 long long now) {
  const std::string newState = state;
  soci::statement update =
      (session.prepare << "UPDATE actions SET state = :state, closed_at = :now"
                          " WHERE device_id = :device AND request_id = :id AND state = 'open'",
       use(newState, "state"), use(now, "now"), use(device, "device"), use(requestId, "id"));
  update.execute(true);
  return update.get_affected_rows() > 0;
}

// Returns what a progress closes an action as, or an empty text.
std::string ClosingState(long long progress) {
  switch (progress) {
    case 0:
      return "done";
    case -1:
      return "failed";
    case -3:
      return "no_file";
    default:
      return "";
  }
}

Admission Refused(int code, const char* message) {
  Admission admission;
  admission.verdict = {code, message};
  return admission;
}

}  // namespace

Admission LookUp(soci::session& session, const std::string& serial, Enrolment enrolment) {
  Admission admission;
  std::string state;
  session << "SELECT id, enrolment FROM devices WHERE serial = :serial", use(serial, "serial"),
      into(admission.device), into(state);
  if (!session.got_data()) {
    if (enrolment == Enrolment::kList) {
      return Refused(kNotAllowed, "this device is not on the list");
    }
    admission.is_new = true;
    return admission;
  }
  if (state != "approved") {
    return Refused(kNotAllowed, state == "waiting" ? "this device waits for approval"
                                                   : "this device is refused");
  }
  return admission;
}

Admission Admit(soci::session& session, const std::string& serial, Enrolment enrolment,
                long long now) {
  Admission admission = LookUp(session, serial, enrolment);
  if (!admission.is_new) {
    return admission;
  }
  if (enrolment == Enrolment::kApproval) {
    InsertDevice(session, serial, "waiting", now);
    return Refused(kNotAllowed, "this device waits for approval");
  }
  admission.device = InsertDevice(session, serial, "approved", now);
  return admission;
}

Json::Value OpenActions(soci::session& session, long long device, long long now) {
  Json::Value actions(Json::arrayValue);
  std::string body;
  soci::statement select =
      (session.prepare << "SELECT body FROM actions WHERE device_id = :device AND state = 'open'"
                          " AND expires_at > :now ORDER BY request_id LIMIT :most",
       use(device, "device"), use(now, "now"), use(kMostActionsInAnAnswer, "most"), into(body));
  select.execute();
  while (select.fetch()) {
    ReadJson(body, actions.append(Json::Value()));
  }
  return actions;
}

Verdict RecordEvent(soci::session& session, const Sender& sender, Enrolment enrolment,
                    const Json::Value& body, long long now) {
  const Admission admission = Admit(session, sender.serial, enrolment, now);
  if (admission.verdict.code != kAccepted) {
    return admission.verdict;
  }
  const long long owner = OwnerOf(session, admission.device, sender, now);
  const std::string name = TextMember(body, "action");
  const std::string text = JsonText(body);
  session << "INSERT INTO events (device_id, owner_id, at, name, body)"
             " VALUES (:device, :owner, :at, :name, :body)",
      use(admission.device, "device"), use(owner, "owner"), use(now, "at"), use(name, "name"),
      use(text, "body");
  if (!IsOwnOwner(session, admission.device, owner)) {
    return {};
  }
  const std::string email = TextMember(body, "hmx_account_email");
  session << "UPDATE devices SET email = :email WHERE id = :device", use(email, "email"),
      use(admission.device, "device");
  if (body.isMember("hmx_info")) {
    const std::string info = JsonText(body["hmx_info"]);
    session << "UPDATE devices SET info = :info WHERE id = :device", use(info, "info"),
        use(admission.device, "device");
  }
  return {};
}

Verdict RecordProgress(soci::session& session, const Sender& sender, const Progress& progress,
                       long long now) {
  const Admission admission = LookUp(session, sender.serial, Enrolment::kOpen);
  if (admission.verdict.code != kAccepted) {
    return admission.verdict;
  }
  if (admission.is_new) {
    return {kUnknownRequest, "nothing was requested of this device"};
  }
  if (progress.request_id != 0 && !IsAction(session, admission.device, progress.request_id)) {
    return {kUnknownRequest, "no action has this number"};
  }
  const long long owner = OwnerOf(session, admission.device, sender, now);
  session << "INSERT INTO progress (device_id, owner_id, request_id, at, value, details)"
             " VALUES (:device, :owner, :id, :at, :value, :details)",
      use(admission.device, "device"), use(owner, "owner"), use(progress.request_id, "id"),
      use(now, "at"), use(progress.value, "value"), use(progress.details, "details");
  const std::string state = ClosingState(progress.value);
  if (!state.empty() && IsOwnOwner(session, admission.device, owner)) {
    CloseAction(session, admission.device, progress.request_id, state.c_str(), now);
  }
  return {};
}

std::string MismatchOf(const Delivery& delivery) {
  Json::Value descriptions;
  if (!ReadJson(delivery.descriptions, descriptions) || !descriptions.isArray()) {
    return R"({"unreadable":true})";
  }
  std::map<std::string, int> files;
  for (const ReceivedFile& file : delivery.files) {
    ++files[file.filename];
  }
  Json::Value missing(Json::arrayValue);
  for (const Json::Value& description : descriptions) {
    const std::string name = TextMember(description, "filename");
    if (files[name] > 0) {
      --files[name];
    } else {
      missing.append(name);
    }
  }
  Json::Value undescribed(Json::arrayValue);
  for (const auto& [name, left] : files) {
    for (int i = 0; i < left; ++i) {
      undescribed.append(name);
    }
  }
  if (missing.empty() && undescribed.empty()) {
    return "";
  }
  Json::Value mismatch;
  mismatch["missing"] = missing;
  mismatch["undescribed"] = undescribed;
  return JsonText(mismatch);
}

namespace {

void InsertFiles(soci::session& session, long long delivery,
                 const std::vector<ReceivedFile>& files) {
  long long number = 0;
  for (const ReceivedFile& file : files) {
    const auto size = static_cast<long long>(file.object.size);
    session << "INSERT INTO files (delivery_id, number, object, filename, content_type, size,"
               " sha256) VALUES (:delivery, :number, :object, :filename, :type, :size, :sha256)",
        use(delivery, "delivery"), use(number, "number"), use(file.object.name, "object"),
        use(file.filename, "filename"), use(file.content_type, "type"), use(size, "size"),
        use(file.object.sha256, "sha256");
    ++number;
  }
}

// The system's version, as the newest collection tells it.
void NoteVersion(soci::session& session, long long device, const std::string& descriptions) {
  Json::Value list;
  if (!ReadJson(descriptions, list) || !list.isArray() || list.empty()) {
    return;
  }
  const std::string version = TextMember(list[0], "version");
  session << "UPDATE devices SET version = :version WHERE id = :device", use(version, "version"),
      use(device, "device");
}

}  // namespace

Verdict RecordDelivery(soci::session& session, const Sender& sender, Enrolment enrolment,
                       const Delivery& delivery, long long now) {
  const Admission admission = Admit(session, sender.serial, enrolment, now);
  if (admission.verdict.code != kAccepted) {
    return admission.verdict;
  }
  const long long device = admission.device;
  if (delivery.is_upload && !IsAction(session, device, delivery.request_id)) {
    return {kUnknownRequest, "no action has this number"};
  }
  const long long owner = OwnerOf(session, device, sender, now);
  const std::string kind = delivery.is_upload ? "upload" : "collection";
  const std::string mismatch = MismatchOf(delivery);
  const std::string descriptions = ValidUtf8(delivery.descriptions);
  long long id = 0;
  session << "INSERT INTO deliveries (device_id, owner_id, kind, request_id, at, descriptions,"
             " mismatch) VALUES (:device, :owner, :kind, :request, :at, :descriptions, :mismatch)"
             " RETURNING id",
      use(device, "device"), use(owner, "owner"), use(kind, "kind"),
      use(delivery.request_id, "request"), use(now, "at"), use(descriptions, "descriptions"),
      use(mismatch, "mismatch"), into(id);
  InsertFiles(session, id, delivery.files);
  if (!IsOwnOwner(session, device, owner)) {
    return {};
  }
  if (!delivery.is_upload) {
    NoteVersion(session, device, descriptions);
  } else if (!delivery.files.empty()) {
    CloseAction(session, device, delivery.request_id, "done", now);
  }
  return {};
}

long long QueueAction(soci::session& session, long long device, const NewAction& action,
                      long long now) {
  std::string serial;
  session << "SELECT serial FROM devices WHERE id = :device", use(device, "device"), into(serial);
  if (!session.got_data()) {
    throw std::invalid_argument("there is no such device");
  }
  const std::string hash = Sha256Of(serial);
  long long id = 0;
  session << "INSERT INTO request_ids (serial_hash, last_id) VALUES (:hash, 1)"
             " ON CONFLICT (serial_hash) DO UPDATE SET last_id = request_ids.last_id + 1"
             " RETURNING last_id",
      use(hash, "hash"), into(id);
  if (id > kLastRequestId) {
    throw std::invalid_argument("all request ids of this device have been used");
  }
  Json::Value body = action.body;
  body["action"] = action.name;
  body["request_id"] = static_cast<Json::Int64>(id);
  const std::string text = JsonText(body);
  session
      << "INSERT INTO actions (device_id, request_id, name, body, state, created_at, expires_at,"
         " closed_at) VALUES (:device, :id, :name, :body, 'open', :now, :expires, 0)",
      use(device, "device"), use(id, "id"), use(action.name, "name"), use(text, "body"),
      use(now, "now"), use(action.expires_at, "expires");
  return id;
}

bool CancelAction(soci::session& session, long long device, long long requestId, long long now) {
  return CloseAction(session, device, requestId, "cancelled", now);
}

void SetEnrolment(soci::session& session, const std::string& serial, const std::string& enrolment,
                  long long now) {
  session << "INSERT INTO devices (serial, enrolment, first_seen, last_seen, last_heartbeat,"
             " owner_id, version, email, info) VALUES (:serial, :enrolment, :now, 0, 0, 0, '', '',"
             " '') ON CONFLICT (serial) DO UPDATE SET enrolment = excluded.enrolment",
      use(serial, "serial"), use(enrolment, "enrolment"), use(now, "now");
}

bool SetOwner(soci::session& session, long long device, long long owner) {
  soci::statement update =
      (session.prepare << "UPDATE devices SET owner_id = :owner WHERE id = :device AND EXISTS"
                          " (SELECT 1 FROM owners WHERE id = :pair AND device_id = :same)",
       use(owner, "owner"), use(device, "device"), use(owner, "pair"), use(device, "same"));
  update.execute(true);
  return update.get_affected_rows() > 0;
}

namespace {

// Removes deliveries and their files' rows; the objects are to be removed once this is committed.
void RemoveDeliveries(soci::session& session, const std::string& condition, long long value) {
  const std::string which = "(SELECT id FROM deliveries WHERE " + condition + " :value)";
  session << "INSERT INTO discarded (object) SELECT object FROM files WHERE delivery_id IN " +
                 which,
      use(value, "value");
  session << "DELETE FROM files WHERE delivery_id IN " + which, use(value, "value");
  session << "DELETE FROM deliveries WHERE " + condition + " :value", use(value, "value");
}

}  // namespace

void Forget(soci::session& session, long long device) {
  RemoveDeliveries(session, "device_id =", device);
  for (const char* table : {"heartbeats", "events", "actions", "progress", "owners"}) {
    session << "DELETE FROM " << table << " WHERE device_id = :device", use(device, "device");
  }
  session << "DELETE FROM devices WHERE id = :device", use(device, "device");
}

void Prune(soci::session& session, long long before) {
  RemoveDeliveries(session, "at <", before);
  for (const char* table : {"heartbeats", "events", "progress"}) {
    session << "DELETE FROM " << table << " WHERE at < :before", use(before, "before");
  }
  session << "DELETE FROM actions WHERE (state <> 'open' AND closed_at < :before)"
             " OR (state = 'open' AND expires_at < :expired)",
      use(before, "before"), use(before, "expired");
}

bool IsNamed(soci::session& session, const std::string& object) {
  int count = 0;
  session << "SELECT COUNT(*) FROM files WHERE object = :object", use(object, "object"),
      into(count);
  return count > 0;
}

std::vector<std::string> Discarded(soci::session& session) {
  std::vector<std::string> objects;
  std::string object;
  soci::statement select = (session.prepare << "SELECT object FROM discarded", into(object));
  select.execute();
  while (select.fetch()) {
    objects.push_back(object);
  }
  return objects;
}

void NoteRemoved(soci::session& session, const std::string& object) {
  session << "DELETE FROM discarded WHERE object = :object", use(object, "object");
}

}  // namespace quendeldesk
