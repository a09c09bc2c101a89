// Receives the files of a collection or an upload: they are written while they arrive, and once all
// are on the disk one transaction names them. What is cut before that leaves nothing.
#include "delivery_exchange.h"

#include <vector>

#include "device_answer.h"
#include "json.h"
#include "multipart.h"

namespace quendeldesk {
namespace {

constexpr size_t kMostFiles = 64;
constexpr size_t kMostDescriptions = kMiB;

class DeliveryExchange : public Exchange, private PartSink {
 public:
  DeliveryExchange(Desk& desk, const DeviceRequest& request, const std::string& boundary)
      : desk_(desk), sender_(request.sender), reader_(boundary, *this) {
    delivery_.is_upload = request.kind == DeviceRequest::Kind::kUpload;
    delivery_.request_id = request.request_id;
  }

  void Take(std::string_view bytes) override;
  void Finish(Reply reply) override;

 private:
  void BeginPart(const PartHead& head) override;
  void PartBytes(std::string_view bytes) override;
  void EndPart() override { open_ = nullptr; }

  void Refuse(const std::string& why);
  void Keep(const Reply& reply);
  void Record(const Reply& reply);

  Desk& desk_;
  const Sender sender_;
  MultipartReader reader_;
  std::vector<std::unique_ptr<ObjectWriter>> writers_;  // of the files, in their order
  ObjectWriter* open_ = nullptr;                        // of the part that arrives, if it is a file
  Delivery delivery_;
  uint64_t size_ = 0;
  Verdict verdict_;
};

// The rest of what is refused is read all the same: see Refusal.
void DeliveryExchange::Take(std::string_view bytes) {
  size_ += bytes.size();
  if (verdict_.code != kAccepted) {
    return;
  }
  try {
    if (size_ > desk_.settings.most_upload_mib * kMiB) {
      Refuse("the files are too large");
    } else if (!reader_.Take(bytes)) {
      Refuse("the request's body is no form");
    }
  } catch (const std::exception&) {
    Refuse(VerdictOf(std::current_exception()).message);
  }
}

void DeliveryExchange::BeginPart(const PartHead& head) {
  if (!head.filename) {
    delivery_.descriptions.clear();  // the last text is the list of descriptions
    return;
  }
  if (writers_.size() >= kMostFiles) {
    Refuse("there are too many files");
    return;
  }
  writers_.push_back(desk_.archive.objects->Create());
  open_ = writers_.back().get();
  ReceivedFile file;
  file.filename = ValidUtf8(*head.filename);
  file.content_type = ValidUtf8(head.content_type);
  delivery_.files.push_back(file);
}

void DeliveryExchange::PartBytes(std::string_view bytes) {
  if (verdict_.code != kAccepted) {
    return;
  }
  if (open_ != nullptr) {
    open_->Write(bytes);
  } else if (delivery_.descriptions.size() + bytes.size() > kMostDescriptions) {
    Refuse("the descriptions are too large");
  } else {
    delivery_.descriptions.append(bytes);
  }
}

void DeliveryExchange::Refuse(const std::string& why) {
  verdict_ = {kOtherFailure, why};
  open_ = nullptr;
  writers_.clear();
}

void DeliveryExchange::Finish(Reply reply) {
  if (verdict_.code == kAccepted && !reader_.complete()) {
    Refuse("the form has no end");
  }
  if (verdict_.code != kAccepted) {
    reply(DeviceAnswer(verdict_));
    return;
  }
  desk_.files.Do([this, reply = std::move(reply)] { Keep(reply); });
}

void RemoveAll(Archive& archive, const std::vector<ReceivedFile>& files) {
  for (const ReceivedFile& file : files) {
    if (!file.object.name.empty()) {
      archive.objects->Remove(file.object.name);
    }
  }
}

void SettleAll(Archive& archive, const std::vector<ReceivedFile>& files) {
  for (const ReceivedFile& file : files) {
    archive.objects->Settle(file.object.name);
  }
}

// What cannot be tidied up now is when the desk starts the next time.
template <typename Work>
void InPeace(Work work) {
  try {
    work();
  } catch (const std::exception&) {
    VerdictOf(std::current_exception());
  }
}

void DeliveryExchange::Keep(const Reply& reply) {
  try {
    for (size_t i = 0; i < writers_.size(); ++i) {
      delivery_.files[i].object = writers_[i]->Keep();
    }
    Record(reply);
  } catch (const std::exception&) {
    InPeace([this] { RemoveAll(desk_.archive, delivery_.files); });
    reply(DeviceAnswer(VerdictOf(std::current_exception())));
  }
}

// Whether a database that failed has committed all the same is not known, so its files stay until
// the next start.
void DeliveryExchange::Record(const Reply& reply) {
  const auto verdict = std::make_shared<Verdict>();
  const auto delivery = std::make_shared<const Delivery>(delivery_);
  desk_.archive.store.Write(
      [verdict, delivery, sender = sender_, enrolment = desk_.settings.enrolment,
       now = NowMs()](soci::session& session) {
        *verdict = RecordDelivery(session, sender, enrolment, *delivery, now);
      },
      [&desk = desk_, verdict, delivery, reply](const std::exception_ptr& failure) {
        if (!failure) {
          desk.files.Do([&archive = desk.archive, verdict, delivery] {
            InPeace([&] {
              verdict->code == kAccepted ? SettleAll(archive, delivery->files)
                                         : RemoveAll(archive, delivery->files);
            });
          });
        }
        reply(DeviceAnswer(failure ? VerdictOf(failure) : *verdict));
      });
}

class NoForm : public Exchange {
 public:
  void Take(std::string_view /*bytes*/) override {}
  void Finish(Reply reply) override {
    reply(DeviceAnswer({kOtherFailure, "the request's body is no form"}));
  }
};

}  // namespace

Verdict DeliveryRefusal(const Desk& desk, const RequestHead& head) {
  const uint64_t length = head.length.value_or(0);
  if (length > desk.settings.most_upload_mib * kMiB) {
    return {kOtherFailure, "the files are too large"};
  }
  if (desk.archive.objects->FreeBytes() < length + desk.settings.least_free_mib * kMiB) {
    return {kOtherFailure, "there is no room for files"};
  }
  return {};
}

std::unique_ptr<Exchange> BeginDelivery(Desk& desk, const DeviceRequest& request,
                                        const std::string& contentType) {
  const std::string boundary = BoundaryOf(contentType);
  if (boundary.empty()) {
    return std::make_unique<NoForm>();
  }
  return std::make_unique<DeliveryExchange>(desk, request, boundary);
}

}  // namespace quendeldesk
