// A request, its answer, and the server between them: libmicrohttpd, with epoll and a few threads,
// so that a client that waits or is slow costs no thread. A handler that has to wait for the
// database suspends its connection and is called again when the answer is there.
#include "http.h"

#include <microhttpd.h>
#include <sys/stat.h>

#include <algorithm>
#include <atomic>
#include <cstring>
#include <stdexcept>
#include <thread>

#include "acceptor.h"
#include "access_log.h"
#include "metrics.h"

namespace quendeldesk {
namespace {

constexpr size_t kConnectionMemory = 32UL * 1024;
constexpr size_t kBlock = 64UL * 1024;
constexpr unsigned kMostConnections = 1'000'000;  // the table counts them

struct Request {
  std::string target;
  std::string method;
  std::string address;
  std::unique_ptr<Exchange> exchange;
  MHD_Connection* connection = nullptr;
  uint64_t received = 0;
  Clock::time_point begun = Clock::now();
  bool asked = false;  // for its answer, which may not be there yet
  std::optional<Answer> answer;
};

int DescriptorOf(MHD_Connection* connection) {
  return MHD_get_connection_info(connection, MHD_CONNECTION_INFO_CONNECTION_FD)->connect_fd;
}

std::string HeaderOf(MHD_Connection* connection, const char* name) {
  const char* value = MHD_lookup_connection_value(connection, MHD_HEADER_KIND, name);
  return value == nullptr ? "" : value;
}

RequestHead HeadOf(MHD_Connection* connection, const Request& request) {
  RequestHead head;
  head.method = request.method;
  head.target = request.target;
  head.address = request.address;
  head.header = [connection](const char* name) { return HeaderOf(connection, name); };
  const std::string length = head.header("Content-Length");
  if (!length.empty()) {
    head.length = strtoull(length.c_str(), nullptr, 10);
  }
  return head;
}

Answer ServerError(const std::exception& error) {
  Answer answer;
  answer.status = 500;
  answer.body = R"({"success":false,"code":119999})";
  answer.code = 119999;
  answer.note = error.what();
  return answer;
}

// The reader of an answer whose body comes from a source.
ssize_t ReadSource(void* source, uint64_t /*at*/, char* buffer, size_t size) {
  try {
    const size_t made = (*static_cast<BodySource*>(source))(buffer, size);
    return made == 0 ? MHD_CONTENT_READER_END_OF_STREAM : static_cast<ssize_t>(made);
  } catch (const std::exception&) {
    return MHD_CONTENT_READER_END_WITH_ERROR;
  }
}
void FreeSource(void* source) {
  delete static_cast<BodySource*>(source);
}

MHD_Response* ResponseOf(Answer& answer) {
  struct stat status = {};
  if (answer.file && fstat(answer.file.get(), &status) == 0) {
    return MHD_create_response_from_fd64(static_cast<uint64_t>(status.st_size),
                                         answer.file.release());
  }
  if (answer.source) {
    return MHD_create_response_from_callback(MHD_SIZE_UNKNOWN, kBlock, ReadSource,
                                             new BodySource(std::move(answer.source)), FreeSource);
  }
  return MHD_create_response_from_buffer(answer.body.size(), answer.body.data(),
                                         MHD_RESPMEM_MUST_COPY);
}

MHD_Result Send(MHD_Connection* connection, Answer& answer) {
  MHD_Response* response = ResponseOf(answer);
  if (response == nullptr) {
    return MHD_NO;
  }
  MHD_add_response_header(response, "Content-Type", answer.type.c_str());
  for (const auto& [name, value] : answer.headers) {
    MHD_add_response_header(response, name.c_str(), value.c_str());
  }
  const MHD_Result result = MHD_queue_response(connection, answer.status, response);
  MHD_destroy_response(response);
  return result;
}

}  // namespace

struct HttpServer::State {
  Service& service;
  ConnectionTable& table;
  HttpLimits limits;
  MHD_Daemon* daemon = nullptr;
  std::atomic<int> pending{0};  // answers that somebody works on
  std::atomic<bool> stopping{false};

  static MHD_Result HandleRequest(void* state, MHD_Connection* connection, const char* url,
                                  const char* method, const char* version, const char* data,
                                  size_t* size, void** request);
  static void EndRequest(void* state, MHD_Connection* connection, void** request,
                         MHD_RequestTerminationCode why);

  MHD_Result Handle(MHD_Connection* connection, Request& request, const char* method,
                    const char* data, size_t& size);
  MHD_Result Begin(MHD_Connection* connection, Request& request, const char* method);
  void TakeBody(Request& request, std::string_view bytes);
  void Ask(Request& request);
  void End(MHD_Connection* connection, const Request& request);
};

// The handler is called when the head is whole, for each piece of the body, when that is whole, and
// once more when the answer is there.
MHD_Result HttpServer::State::Handle(MHD_Connection* connection, Request& request,
                                     const char* method, const char* data, size_t& size) {
  try {
    if (!request.exchange) {
      return Begin(connection, request, method);
    }
    if (size > 0) {
      TakeBody(request, {data, size});
      size = 0;
      return MHD_YES;
    }
    if (!request.asked) {
      Ask(request);
      return MHD_YES;
    }
    return Send(connection, *request.answer);
  } catch (const std::exception& error) {
    request.answer = ServerError(error);
    return MHD_NO;
  }
}

MHD_Result HttpServer::State::Begin(MHD_Connection* connection, Request& request,
                                    const char* method) {
  const auto* info = MHD_get_connection_info(connection, MHD_CONNECTION_INFO_CLIENT_ADDRESS);
  request.connection = connection;
  request.method = method;
  request.address = CountedAddress(info->client_addr);
  request.exchange = service.Begin(HeadOf(connection, request));
  table.WaitForMore(DescriptorOf(connection), Clock::now() + limits.more_time);
  return MHD_YES;
}

// A body has to come at the least rate, and may pause for a while.
void HttpServer::State::TakeBody(Request& request, std::string_view bytes) {
  request.received += bytes.size();
  const auto earned = std::chrono::seconds(request.received / limits.least_rate);
  table.WaitForMore(
      DescriptorOf(request.connection),
      std::min(request.begun + limits.more_time + earned, Clock::now() + limits.more_time));
  request.exchange->Take(bytes);
}

// Suspends before it asks, as the answer may come at once and from another thread.
void HttpServer::State::Ask(Request& request) {
  request.asked = true;
  table.WaitForMore(DescriptorOf(request.connection), Clock::now() + limits.answer_time);
  MHD_suspend_connection(request.connection);
  ++pending;
  const auto reply = [this, &request](Answer answer) {
    request.answer = std::move(answer);
    MHD_resume_connection(request.connection);
    --pending;
  };
  try {
    if (stopping) {
      throw std::runtime_error("the desk is being stopped");
    }
    request.exchange->Finish(reply);
  } catch (const std::exception& error) {
    reply(ServerError(error));
  }
}

void HttpServer::State::End(MHD_Connection* connection, const Request& request) {
  AccessLine line;
  line.address = request.address;
  line.method = request.method;
  line.target = request.target;
  line.received = request.received;
  line.duration = Clock::now() - request.begun;
  line.cut = !request.answer || !request.asked;
  if (request.answer) {
    line.status = request.answer->status;
    line.code = request.answer->code;
    line.note = request.answer->note;
  }
  WriteAccessLine(line);
  CountRequest(line);
  table.WaitForHead(DescriptorOf(connection), Clock::now() + limits.head_time);
}

namespace {

// What the library calls, with its own types.
size_t KeepVerbatim(void* /*unused*/, MHD_Connection* /*connection*/, char* text) {
  return strlen(text);
}
void LogNothing(void* /*unused*/, const char* /*format*/, va_list /*arguments*/) {
}

void* BeginTarget(void* /*unused*/, const char* target, MHD_Connection* /*connection*/) {
  auto* request = new Request;
  request->target = target;
  return request;
}

void ConnectionChanged(void* table, MHD_Connection* connection, void** /*context*/,
                       MHD_ConnectionNotificationCode what) {
  if (what == MHD_CONNECTION_NOTIFY_CLOSED) {
    static_cast<ConnectionTable*>(table)->Remove(DescriptorOf(connection));
  }
}

constexpr unsigned kFlags = MHD_USE_EPOLL_INTERNAL_THREAD | MHD_USE_NO_LISTEN_SOCKET | MHD_USE_ITC |
                            MHD_ALLOW_SUSPEND_RESUME | MHD_USE_ERROR_LOG;

}  // namespace

MHD_Result HttpServer::State::HandleRequest(void* state, MHD_Connection* connection,
                                            const char* /*url*/, const char* method,
                                            const char* /*version*/, const char* data, size_t* size,
                                            void** request) {
  return static_cast<State*>(state)->Handle(connection, *static_cast<Request*>(*request), method,
                                            data, *size);
}

void HttpServer::State::EndRequest(void* state, MHD_Connection* connection, void** request,
                                   MHD_RequestTerminationCode /*why*/) {
  const std::unique_ptr<Request> ended(static_cast<Request*>(*request));
  *request = nullptr;
  if (ended) {
    static_cast<State*>(state)->End(connection, *ended);
  }
}

HttpServer::HttpServer(Service& service, ConnectionTable& table, const HttpLimits& limits,
                       unsigned threads, const Identity* identity)
    : state_(new State{service, table, limits}) {
  std::vector<MHD_OptionItem> tls;
  if (identity != nullptr) {
    tls.push_back({MHD_OPTION_HTTPS_MEM_CERT, 0, const_cast<char*>(identity->certificate.c_str())});
    tls.push_back({MHD_OPTION_HTTPS_MEM_KEY, 0, const_cast<char*>(identity->key.c_str())});
  }
  tls.push_back({MHD_OPTION_END, 0, nullptr});
  State* state = state_.get();
  state->daemon = MHD_start_daemon(kFlags | (identity != nullptr ? unsigned{MHD_USE_TLS} : 0U), 0,
                                   nullptr, nullptr, &State::HandleRequest, state,            //
                                   MHD_OPTION_EXTERNAL_LOGGER, &LogNothing, nullptr,          //
                                   MHD_OPTION_THREAD_POOL_SIZE, threads,                      //
                                   MHD_OPTION_CONNECTION_LIMIT, kMostConnections,             //
                                   MHD_OPTION_CONNECTION_MEMORY_LIMIT, kConnectionMemory,     //
                                   MHD_OPTION_UNESCAPE_CALLBACK, &KeepVerbatim, nullptr,      //
                                   MHD_OPTION_URI_LOG_CALLBACK, &BeginTarget, nullptr,        //
                                   MHD_OPTION_NOTIFY_COMPLETED, &State::EndRequest, state,    //
                                   MHD_OPTION_NOTIFY_CONNECTION, &ConnectionChanged, &table,  //
                                   MHD_OPTION_ARRAY, tls.data(), MHD_OPTION_END);
  if (state->daemon == nullptr) {
    throw std::runtime_error("cannot start the HTTP server");
  }
}

// The library wants no connection suspended when it is stopped.
HttpServer::~HttpServer() {
  state_->stopping = true;
  while (state_->pending > 0) {
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
  }
  MHD_stop_daemon(state_->daemon);
}

// The library closes the descriptor when it cannot take it.
void HttpServer::Take(int descriptor, const sockaddr* address, socklen_t size) {
  if (MHD_add_connection(state_->daemon, descriptor, address, size) != MHD_YES) {
    state_->table.Remove(descriptor);
  }
}

}  // namespace quendeldesk
