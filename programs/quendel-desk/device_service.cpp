// Answers the devices. Every answer has the status 200: a device takes anything else for a failure
// of the way to the server, and learns no reason.
#include "device_service.h"

#include "delivery_exchange.h"
#include "device_answer.h"
#include "device_request.h"
#include "json.h"

namespace quendeldesk {
namespace {

constexpr size_t kMostJson = kMiB;

// Reads what comes and throws it away, so that the device gets to read the refusal: it does not
// look for an answer before it has sent everything.
class Refusal : public Exchange {
 public:
  explicit Refusal(Verdict verdict) : verdict_(std::move(verdict)) {}
  void Take(std::string_view /*bytes*/) override {}
  void Finish(Reply reply) override { reply(DeviceAnswer(verdict_)); }

 private:
  const Verdict verdict_;
};

// A request with a JSON body.
class Conversation : public Exchange {
 public:
  Conversation(Desk& desk, DeviceRequest request) : desk_(desk), request_(std::move(request)) {}

  void Take(std::string_view bytes) override {
    size_ += bytes.size();
    if (size_ <= kMostJson) {
      body_.append(bytes);
    }
  }

  void Finish(Reply reply) override {
    Json::Value body;
    if (size_ > kMostJson) {
      reply(DeviceAnswer({kOtherFailure, "the request's body is too large"}));
    } else if (!ReadJson(body_, body)) {
      reply(DeviceAnswer({kOtherFailure, "the request's body is no JSON"}));
    } else {
      Carry(body, std::move(reply));
    }
  }

 private:
  void Carry(const Json::Value& body, Reply reply);
  void Heartbeat(const Reply& reply);
  void AdmitNew(const Reply& reply);

  // Makes a change and answers with its verdict once it is on the disk.
  void Record(std::function<Verdict(soci::session&)> change, Reply reply) {
    const auto verdict = std::make_shared<Verdict>();
    desk_.archive.store.Write(
        [change = std::move(change), verdict](soci::session& session) {
          *verdict = change(session);
        },
        [verdict, reply = std::move(reply)](const std::exception_ptr& failure) {
          reply(DeviceAnswer(failure ? VerdictOf(failure) : *verdict));
        });
  }

  Desk& desk_;
  const DeviceRequest request_;
  std::string body_;
  size_t size_ = 0;
};

void Conversation::Carry(const Json::Value& body, Reply reply) {
  const long long now = NowMs();
  if (request_.kind == DeviceRequest::Kind::kHeartbeat) {
    desk_.lookups.Do([this, reply = std::move(reply)] { Heartbeat(reply); });
  } else if (request_.kind == DeviceRequest::Kind::kProgress) {
    const Progress progress = {request_.request_id, request_.progress, JsonText(body)};
    Record([sender = request_.sender, progress,
            now](soci::session& session) { return RecordProgress(session, sender, progress, now); },
           std::move(reply));
  } else if (!body.isObject()) {
    reply(DeviceAnswer({kOtherFailure, "an event is a JSON object"}));
  } else {
    Record(
        [sender = request_.sender, enrolment = desk_.settings.enrolment, body, now](
            soci::session& session) { return RecordEvent(session, sender, enrolment, body, now); },
        std::move(reply));
  }
}

// The time of a heartbeat may be lost in a crash, so one of a known device waits for no commit.
void Conversation::Heartbeat(const Reply& reply) {
  try {
    const long long now = NowMs();
    Json::Value actions;
    const Admission admission = desk_.archive.store.Read([&](soci::session& session) {
      Admission found = LookUp(session, request_.sender.serial, desk_.settings.enrolment);
      if (found.verdict.code == kAccepted && !found.is_new) {
        actions = OpenActions(session, found.device, now);
      }
      return found;
    });
    if (admission.is_new) {
      AdmitNew(reply);
      return;
    }
    if (admission.verdict.code == kAccepted) {
      desk_.archive.store.NoteHeartbeat(admission.device, now);
    }
    reply(DeviceAnswer(admission.verdict, actions));
  } catch (const std::exception&) {
    reply(DeviceAnswer(VerdictOf(std::current_exception())));
  }
}

void Conversation::AdmitNew(const Reply& reply) {
  const auto admission = std::make_shared<Admission>();
  const long long now = NowMs();
  Store& store = desk_.archive.store;
  store.Write(
      [serial = request_.sender.serial, enrolment = desk_.settings.enrolment, now,
       admission](soci::session& session) { *admission = Admit(session, serial, enrolment, now); },
      [&store, admission, now, reply](const std::exception_ptr& failure) {
        const Verdict verdict = failure ? VerdictOf(failure) : admission->verdict;
        if (verdict.code == kAccepted) {
          store.NoteHeartbeat(admission->device, now);
        }
        reply(DeviceAnswer(verdict, Json::Value(Json::arrayValue)));
      });
}

bool IsDelivery(const DeviceRequest& request) {
  return request.kind == DeviceRequest::Kind::kCollection ||
         request.kind == DeviceRequest::Kind::kUpload;
}

// Returns why a request is refused before its body is looked at, if it is.
Verdict RefusalOf(Desk& desk, const RequestHead& head,
                  const std::optional<DeviceRequest>& request) {
  const Clock::time_point now = Clock::now();
  if (!desk.per_address.Allow(head.address, now)) {
    return {kOtherFailure, "too many requests from this address"};
  }
  if (!request || head.method != "POST") {
    return {kUnknownRequest, "there is no such request"};
  }
  if (!desk.per_device.Allow(request->sender.serial, now)) {
    return {kOtherFailure, "too many requests of this device"};
  }
  return IsDelivery(*request) ? DeliveryRefusal(desk, head) : Verdict();
}

}  // namespace

std::unique_ptr<Exchange> DeviceService::Begin(const RequestHead& head) {
  const std::optional<DeviceRequest> request = DeviceRequestFrom(head.target);
  const Verdict refusal = RefusalOf(desk_, head, request);
  if (refusal.code != kAccepted) {
    return std::make_unique<Refusal>(refusal);
  }
  if (IsDelivery(*request)) {
    return BeginDelivery(desk_, *request, head.header("Content-Type"));
  }
  return std::make_unique<Conversation>(desk_, *request);
}

}  // namespace quendeldesk
