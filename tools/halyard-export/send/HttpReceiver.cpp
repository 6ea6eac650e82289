#include "send/HttpReceiver.h"

#include <algorithm>
#include <array>
#include <curl/curl.h>
#include <mutex>

#include "send/TlsTrouble.h"

namespace halyard::exporting {
namespace {

// Of an answer: a partial success with its message is far smaller.
constexpr std::size_t kMostAnswer = 64 * 1024;
// After which the connection is rather given up than read to its end.
constexpr std::size_t kMostIgnored = 1024 * 1024;
constexpr const char* kUserAgent = "User-Agent: OTel-OTLP-Exporter-halyard/" HALYARD_VERSION;

struct Taking {
    std::string* body;
    std::size_t seen = 0;
};

std::size_t takeBody(char* bytes, std::size_t size, std::size_t count, void* context) {
    auto* const taking = static_cast<Taking*>(context);
    const std::size_t length = size * count;
    const std::size_t room = kMostAnswer - std::min(kMostAnswer, taking->body->size());
    taking->body->append(bytes, std::min(length, room));
    taking->seen += length;
    return taking->seen > kMostIgnored ? 0 : length;
}

int askWhetherToGoOn(void* context, curl_off_t /*total*/, curl_off_t /*now*/, curl_off_t /*up*/,
                     curl_off_t /*upNow*/) {
    return (*static_cast<const HttpReceiver::MayGoOn*>(context))() ? 0 : 1;
}

class HeaderList {
public:
    HeaderList() = default;
    ~HeaderList() { curl_slist_free_all(list_); }
    HeaderList(const HeaderList&) = delete;
    HeaderList& operator=(const HeaderList&) = delete;

    void add(const std::string& line) { list_ = curl_slist_append(list_, line.c_str()); }
    curl_slist* get() const { return list_; }

private:
    curl_slist* list_ = nullptr;
};

} // namespace

struct HttpReceiver::Handle {
    Handle() {
        static std::once_flag once;
        std::call_once(once, [] { curl_global_init(CURL_GLOBAL_DEFAULT); });
        curl = curl_easy_init();
    }
    ~Handle() { curl_easy_cleanup(curl); }
    Handle(const Handle&) = delete;
    Handle& operator=(const Handle&) = delete;

    CURL* curl = nullptr;
};

HttpReceiver::HttpReceiver(const Options& options, MayGoOn mayGoOn)
    : options_(options), mayGoOn_(std::move(mayGoOn)), handle_(std::make_unique<Handle>()) {}

HttpReceiver::~HttpReceiver() = default;

Answer HttpReceiver::post(Signal signal, std::string_view body, bool isCompressed) {
    Answer answer;
    CURL* const curl = handle_->curl;
    if (curl == nullptr) {
        answer.error = "no memory for a connection";
        return answer;
    }
    curl_easy_reset(curl); // its connections stay
    const auto index = static_cast<std::size_t>(signal);
    HeaderList headers;
    headers.add("Content-Type: application/x-protobuf");
    headers.add(kUserAgent);
    headers.add("Expect:"); // no waiting for leave to send
    if (isCompressed) {
        headers.add("Content-Encoding: gzip");
    }
    for (const auto& [name, value] : options_.headers[index]) {
        // In the form that curl takes for a header without a value.
        headers.add(value.empty() ? name + ";" : name + ": " + value);
    }
    Taking taking{&answer.body};
    std::array<char, CURL_ERROR_SIZE> why{};
    const auto set = [curl](CURLoption option, auto value) {
        (void)curl_easy_setopt(curl, option, value);
    };
    set(CURLOPT_URL, options_.urls[index].c_str());
    set(CURLOPT_PROTOCOLS_STR, "http,https");
    set(CURLOPT_FOLLOWLOCATION, 0L);
    set(CURLOPT_NOSIGNAL, 1L);
    set(CURLOPT_POST, 1L);
    set(CURLOPT_POSTFIELDS, body.data());
    set(CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(body.size()));
    set(CURLOPT_HTTPHEADER, headers.get());
    set(CURLOPT_TIMEOUT_MS, static_cast<long>(options_.timeout.count()));
    set(CURLOPT_WRITEFUNCTION, takeBody);
    set(CURLOPT_WRITEDATA, static_cast<void*>(&taking));
    set(CURLOPT_ERRORBUFFER, why.data());
    set(CURLOPT_NOPROGRESS, 0L);
    set(CURLOPT_XFERINFOFUNCTION, askWhetherToGoOn);
    set(CURLOPT_XFERINFODATA, const_cast<void*>(static_cast<const void*>(&mayGoOn_)));
    const std::pair<CURLoption, const std::string*> files[] = {
        {CURLOPT_CAINFO, &options_.certificate},
        {CURLOPT_SSLCERT, &options_.clientCertificate},
        {CURLOPT_SSLKEY, &options_.clientKey}};
    for (const auto& [option, path] : files) {
        if (!path->empty()) {
            set(option, path->c_str());
        }
    }
    const CURLcode code = curl_easy_perform(curl);
    long status = 0;
    (void)curl_easy_getinfo(curl, CURLINFO_RESPONSE_CODE, &status);
    curl_off_t retryAfter = 0;
    (void)curl_easy_getinfo(curl, CURLINFO_RETRY_AFTER, &retryAfter);
    answer.retryAfter = std::chrono::seconds(std::max<curl_off_t>(retryAfter, 0));
    answer.isStopped = code == CURLE_ABORTED_BY_CALLBACK;
    // An answer that was cut off because of its length was one all the same.
    const bool isTooLong = code == CURLE_WRITE_ERROR && taking.seen > kMostIgnored;
    if (code == CURLE_OK || isTooLong) {
        answer.status = static_cast<int>(status);
    } else {
        answer.error = why.front() != '\0' ? why.data() : curl_easy_strerror(code);
        if (options_.clientCertificate.empty() && options_.urls[index].starts_with("https:")) {
            answer.error = troubleWithoutCertificate(answer.error, code == CURLE_SEND_ERROR ||
                                                                       code == CURLE_RECV_ERROR);
        }
    }
    return answer;
}

} // namespace halyard::exporting
