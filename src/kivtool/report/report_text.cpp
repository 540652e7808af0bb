#include "kivtool/report/report_text.h"

#include <google/protobuf/text_format.h>

#include <stdexcept>

#include "kivtool/report/known_payload.h"
#include "toolkit/text_escape.h"

namespace kivd {
namespace {

namespace protobuf = google::protobuf;

// Prints an event, and its payload if the message is known.
class event_printer : public protobuf::TextFormat::MessagePrinter {
 public:
    void Print(const protobuf::Message& message, bool /*single_line_mode*/,
               protobuf::TextFormat::BaseTextGenerator* generator) const override {
        std::string text;
        (void)protobuf::TextFormat::PrintToString(message, &text);
        const std::string known = known_payload_text(static_cast<const kiv::Event&>(message));
        if (!known.empty()) text += "# " + known + '\n';
        generator->PrintString(text);
    }
};

class text_view : public report_view {
 public:
    explicit text_view(std::ostream& out) : out_(out) {
        auto for_events = std::make_unique<event_printer>();
        if (printer_.RegisterMessagePrinter(kiv::Event::descriptor(), for_events.get())) {
            (void)for_events.release();  // now owned by the printer
        }
    }

    void start_file(const std::string& path) override {
        if (!is_first_) out_ << '\n';
        is_first_ = false;
        out_ << "# " << printable(path) << '\n';
    }

    void add(const report_record& record) override {
        alone_.Clear();
        const auto size = static_cast<int>(record.bytes.size());
        if (!alone_.ParsePartialFromArray(record.bytes.data(), size) ||
            !printer_.PrintToString(alone_, &text_)) {
            throw std::runtime_error("cannot be put as text");
        }
        out_ << text_;
    }

    std::string finish_file(const report_reader& /*file*/) override { return ""; }

 private:
    std::ostream& out_;
    bool is_first_ = true;
    protobuf::TextFormat::Printer printer_;
    kiv::Report alone_;  // a record
    std::string text_;
};

}  // namespace

std::unique_ptr<report_view> make_text_view(std::ostream& out) {
    return std::make_unique<text_view>(out);
}

}  // namespace kivd
