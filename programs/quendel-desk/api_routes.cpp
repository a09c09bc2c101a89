// What programs may ask, and how each question is answered.
#include "api_routes.h"

#include <algorithm>

#include "actions.h"
#include "archive_list.h"
#include "json.h"
#include "metrics.h"
#include "openapi.h"
#include "views.h"

namespace quendeldesk {
namespace {

constexpr long long kMostRows = 1000;

// ---- The parts of a call

long long NumberIn(const ApiCall& call, const char* name, long long standard, long long most) {
  const auto found = call.query.find(name);
  if (found == call.query.end()) {
    return standard;
  }
  constexpr size_t kMostDigits = 18;
  const std::string& text = found->second;
  if (text.empty() || text.size() > kMostDigits ||
      text.find_first_not_of("0123456789") != text.npos || std::stoll(text) > most) {
    throw ApiError(400,
                   std::string("\"") + name + "\" is a number of at most " + std::to_string(most));
  }
  return std::stoll(text);
}

Span SpanOf(const ApiCall& call) {
  constexpr long long kEver = 999'999'999'999'999;
  Span span;
  span.from = NumberIn(call, "from", 0, kEver);
  span.to = NumberIn(call, "to", kEver, kEver);
  span.limit = static_cast<int>(NumberIn(call, "limit", 100, kMostRows));
  return span;
}

Store& StoreOf(ApiCall& call) {
  return call.desk.archive.store;
}

Json::Value Found(Json::Value view, const char* what) {
  if (view.isNull()) {
    throw ApiError(404, std::string("there is no such ") + what);
  }
  return view;
}

Json::Value DeviceOf(ApiCall& call) {
  return Found(StoreOf(call).Read(
                   [&](soci::session& session) { return DeviceView(session, call.numbers[0]); }),
               "device");
}

// Answers {name: rows} with the rows of the device that the path names.
template <typename Rows>
Answer ListAnswer(ApiCall& call, const char* name, Rows rows) {
  DeviceOf(call);
  Json::Value body;
  body[name] = StoreOf(call).Read(rows);
  return JsonAnswer(body);
}

// ---- Devices

Answer GetDevices(ApiCall& call) {
  DeviceQuery query;
  query.text = call.query["q"];
  query.after = NumberIn(call, "after", 0, INT64_MAX / 10);
  query.limit = static_cast<int>(NumberIn(call, "limit", 100, kMostRows));
  Json::Value body;
  body["devices"] =
      StoreOf(call).Read([&](soci::session& session) { return DeviceList(session, query); });
  const Json::Value& devices = body["devices"];
  const bool full = devices.size() == static_cast<Json::ArrayIndex>(query.limit);
  body["next"] = full ? devices[devices.size() - 1]["id"] : Json::Value();
  return JsonAnswer(body);
}

std::string EnrolmentIn(const Json::Value& body) {
  std::string enrolment = TextMember(body, "enrolment");
  if (enrolment != "approved" && enrolment != "refused" && enrolment != "waiting") {
    throw ApiError(400, "\"enrolment\" is \"approved\", \"refused\" or \"waiting\"");
  }
  return enrolment;
}

Answer PutSerial(ApiCall& call, const std::string& serial, unsigned status) {
  const std::string enrolment = EnrolmentIn(call.body);
  StoreOf(call).WriteAndWait(
      [&](soci::session& session) { SetEnrolment(session, serial, enrolment, NowMs()); });
  return JsonAnswer(StoreOf(call).Read([&](soci::session& session) {
    return DeviceView(session, DeviceBySerial(session, serial));
  }),
                    status);
}

Answer PostDevice(ApiCall& call) {
  if (!call.body.isObject() || !call.body["serial"].isString()) {
    throw ApiError(400, "\"serial\" is the serial number, a text");
  }
  return PutSerial(call, call.body["serial"].asString(), 201);
}

Answer GetDevice(ApiCall& call) {
  return JsonAnswer(DeviceOf(call));
}

Answer PutEnrolment(ApiCall& call) {
  return PutSerial(call, DeviceOf(call)["serial"].asString(), 200);
}

Answer PutOwner(ApiCall& call) {
  DeviceOf(call);
  if (!call.body.isObject() || !call.body["owner"].isInt64()) {
    throw ApiError(400, "\"owner\" is the number of one of the device's pairs of account fields");
  }
  const long long owner = call.body["owner"].asInt64();
  bool changed = false;
  StoreOf(call).WriteAndWait(
      [&](soci::session& session) { changed = SetOwner(session, call.numbers[0], owner); });
  if (!changed) {
    throw ApiError(400, "the device has never shown these account fields");
  }
  return GetDevice(call);
}

Answer DeleteDevice(ApiCall& call) {
  DeviceOf(call);
  StoreOf(call).WriteAndWait([&](soci::session& session) { Forget(session, call.numbers[0]); });
  call.desk.archive.RemoveDiscarded();
  return JsonAnswer(Json::Value(Json::objectValue));
}

Answer GetTimeLine(ApiCall& call) {
  const Span span = SpanOf(call);
  return ListAnswer(call, "entries", [&](soci::session& session) {
    return TimeLine(session, call.numbers[0], span, NowMs());
  });
}

Answer GetHeartbeats(ApiCall& call) {
  const Span span = SpanOf(call);
  return ListAnswer(call, "heartbeats", [&](soci::session& session) {
    return Heartbeats(session, call.numbers[0], span);
  });
}

// ---- Actions

Answer GetActions(ApiCall& call) {
  return ListAnswer(call, "actions", [&](soci::session& session) {
    return ActionList(session, call.numbers[0], NowMs());
  });
}

Answer PostAction(ApiCall& call) {
  DeviceOf(call);
  const long long now = NowMs();
  const NewAction action = ActionFrom(call.body, now);
  long long id = 0;
  StoreOf(call).WriteAndWait(
      [&](soci::session& session) { id = QueueAction(session, call.numbers[0], action, now); });
  Json::Value body;
  body["request_id"] = static_cast<Json::Int64>(id);
  return JsonAnswer(body, 201);
}

Answer DeleteAction(ApiCall& call) {
  DeviceOf(call);
  bool cancelled = false;
  StoreOf(call).WriteAndWait([&](soci::session& session) {
    cancelled = CancelAction(session, call.numbers[0], call.numbers[1], NowMs());
  });
  if (!cancelled) {
    throw ApiError(404, "there is no such open action");
  }
  return JsonAnswer(Json::Value(Json::objectValue));
}

// ---- Deliveries

Answer DeliveriesAnswer(ApiCall& call, const char* name, const char* kind) {
  const Span span = SpanOf(call);
  return ListAnswer(call, name, [&](soci::session& session) {
    return DeliveryList(session, call.numbers[0], kind, span);
  });
}

Answer GetCollections(ApiCall& call) {
  return DeliveriesAnswer(call, "collections", "collection");
}
Answer GetUploads(ApiCall& call) {
  return DeliveriesAnswer(call, "uploads", "upload");
}

Json::Value DeliveryOf(ApiCall& call, const char* kind) {
  return Found(StoreOf(call).Read([&](soci::session& session) {
    return DeliveryView(session, call.numbers[0], kind);
  }),
               kind);
}

FileRow FileOf(ApiCall& call, const char* kind) {
  DeliveryOf(call, kind);
  const std::vector<FileRow> files =
      StoreOf(call).Read([&](soci::session& session) { return FilesOf(session, call.numbers[0]); });
  for (const FileRow& file : files) {
    if (file.number == call.numbers[1]) {
      return file;
    }
  }
  throw ApiError(404, "there is no such file");
}

// A file of a device is nothing to show: whoever asks for it saves it.
Answer Download(const std::string& name) {
  std::string harmless = name;
  std::replace_if(
      harmless.begin(), harmless.end(),
      [](char c) { return c <= ' ' || c > '~' || c == '"' || c == '\\' || c == '/' || c == ';'; },
      '_');
  Answer answer;
  answer.type = "application/octet-stream";
  answer.headers = {{"Content-Disposition", "attachment; filename=\"" + harmless + "\""}};
  return answer;
}

Answer FileAnswer(ApiCall& call, const char* kind) {
  const FileRow file = FileOf(call, kind);
  Answer answer = Download(file.filename);
  answer.file = call.desk.archive.objects->Open(file.object);
  return answer;
}

Answer EntriesAnswer(ApiCall& call, const char* kind) {
  return JsonAnswer(ListArchive(call.desk.archive.objects->Open(FileOf(call, kind).object)));
}

Answer EntryAnswer(ApiCall& call, const char* kind) {
  const FileRow file = FileOf(call, kind);
  Answer answer = Download("entry-" + std::to_string(call.numbers[2]));
  try {
    answer.source = ReadArchiveEntry(call.desk.archive.objects->Open(file.object), call.numbers[2]);
  } catch (const std::out_of_range& error) {
    throw ApiError(404, error.what());
  }
  return answer;
}

template <Answer (*kAnswer)(ApiCall&, const char*)>
Answer OfCollection(ApiCall& call) {
  return kAnswer(call, "collection");
}
template <Answer (*kAnswer)(ApiCall&, const char*)>
Answer OfUpload(ApiCall& call) {
  return kAnswer(call, "upload");
}

Answer DeliveryAnswer(ApiCall& call, const char* kind) {
  return JsonAnswer(DeliveryOf(call, kind));
}

Answer GetOpenApi(ApiCall& /*call*/) {
  Answer answer;
  answer.body = kOpenApi;
  return answer;
}

}  // namespace

Answer JsonAnswer(const Json::Value& body, unsigned status) {
  Answer answer;
  answer.status = status;
  answer.body = JsonText(body);
  return answer;
}

Answer MetricsAnswer(ApiCall& call) {
  Gauges gauges;
  gauges.connections = call.table.size();
  gauges.free_bytes = call.desk.archive.objects->FreeBytes();
  StoreOf(call).Read([&](soci::session& session) {
    gauges.devices = CountOf(session, "devices");
    gauges.open_actions = CountOpenActions(session, NowMs());
    return 0;
  });
  Answer answer;
  answer.type = "text/plain; version=0.0.4";
  answer.body = MetricsText(gauges);
  return answer;
}

const std::vector<ApiRoute>& ApiRouteTable() {
  static const std::vector<ApiRoute> routes = {
      {"GET", "/openapi.json", GetOpenApi},
      {"GET", "/devices", GetDevices},
      {"POST", "/devices", PostDevice},
      {"GET", "/devices/{device}", GetDevice},
      {"DELETE", "/devices/{device}", DeleteDevice},
      {"PUT", "/devices/{device}/enrolment", PutEnrolment},
      {"PUT", "/devices/{device}/owner", PutOwner},
      {"GET", "/devices/{device}/timeline", GetTimeLine},
      {"GET", "/devices/{device}/heartbeats", GetHeartbeats},
      {"GET", "/devices/{device}/actions", GetActions},
      {"POST", "/devices/{device}/actions", PostAction},
      {"DELETE", "/devices/{device}/actions/{request_id}", DeleteAction},
      {"GET", "/devices/{device}/collections", GetCollections},
      {"GET", "/devices/{device}/uploads", GetUploads},
      {"GET", "/collections/{collection}", OfCollection<DeliveryAnswer>},
      {"GET", "/collections/{collection}/files/{file}", OfCollection<FileAnswer>},
      {"GET", "/collections/{collection}/files/{file}/entries", OfCollection<EntriesAnswer>},
      {"GET", "/collections/{collection}/files/{file}/entries/{entry}", OfCollection<EntryAnswer>},
      {"GET", "/uploads/{upload}", OfUpload<DeliveryAnswer>},
      {"GET", "/uploads/{upload}/files/{file}", OfUpload<FileAnswer>},
      {"GET", "/uploads/{upload}/files/{file}/entries", OfUpload<EntriesAnswer>},
      {"GET", "/uploads/{upload}/files/{file}/entries/{entry}", OfUpload<EntryAnswer>},
  };
  return routes;
}

}  // namespace quendeldesk
