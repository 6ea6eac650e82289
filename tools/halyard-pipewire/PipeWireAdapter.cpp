#include "PipeWireAdapter.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstring>
#include <map>
#include <mutex>
#include <optional>
#include <stdexcept>
#include <string_view>
#include <utility>
#include <vector>

#include "GraphObjects.h"
#include "NodeParams.h"
#include "PipeWireHeaders.h"
#include "StreamFacts.h"

namespace halyard::pipewire {

namespace {

using Clock = std::chrono::steady_clock;

std::optional<ObjectId> objectId(const spa_dict* properties, const char* key) {
    const char* const text = properties == nullptr ? nullptr : spa_dict_lookup(properties, key);
    if (text == nullptr) {
        return std::nullopt;
    }
    ObjectId id = 0;
    const std::string_view view = text;
    const auto result = std::from_chars(view.data(), view.data() + view.size(), id);
    return result.ec == std::errc() ? std::optional(id) : std::nullopt;
}

timespec toTimespec(std::chrono::nanoseconds time) {
    const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(time);
    return {.tv_sec = seconds.count(), .tv_nsec = (time - seconds).count()};
}

} // namespace

class PipeWireAdapter::Impl final {
public:
    Impl(Options options, GraphListener listener);
    ~Impl();

    void iterate(int timeoutMs);
    void post(std::function<void()> work);
    void every(std::chrono::milliseconds period, std::function<void()> work);
    void quitOnSignal(int signal);

    bool connected() const { return core_ != nullptr && established_; }
    bool quitting() const { return quitting_; }

private:
    void connect();
    void disconnect();
    void lost(const char* reason);
    void established();
    void retryLater();
    void setTimer(spa_source* timer, std::chrono::nanoseconds delay);
    void tell(const GraphEvent& event);
    void note(const std::string& text) const;
    template <class Object, class... More>
    void bind(ObjectId id, const char* type, std::uint32_t version, const More&... more);

    static void onGlobal(void* data, ObjectId id, std::uint32_t permissions, const char* type,
                         std::uint32_t version, const spa_dict* properties);
    static void onGlobalRemoved(void* data, ObjectId id);
    static void onCoreError(void* data, std::uint32_t id, int sequence, int result,
                            const char* message);
    static void onSettled(void* data, std::uint64_t expirations);
    static void onRetry(void* data, std::uint64_t expirations);
    static void onTick(void* data, std::uint64_t expirations);
    static void onPosted(void* data, std::uint64_t count);
    static void onSignal(void* data, int signal);

    static const pw_registry_events kRegistryEvents;
    static const pw_core_events kCoreEvents;

    const Options options_;
    const GraphListener outside_;
    const GraphListener listener_; // what bound objects tell: outside_, and the burst goes on

    pw_loop* loop_ = nullptr;
    pw_context* context_ = nullptr;
    pw_core* core_ = nullptr;
    pw_registry* registry_ = nullptr;
    spa_hook coreHook_{};
    spa_hook registryHook_{};
    spa_source* settleTimer_ = nullptr;
    spa_source* retryTimer_ = nullptr;
    spa_source* postedEvent_ = nullptr;
    spa_source* tickTimer_ = nullptr;
    std::function<void()> tick_;
    std::map<ObjectId, std::unique_ptr<BoundObject>> objects_;

    std::optional<Clock::time_point> burstBegan_;
    std::chrono::milliseconds nextRetry_;
    bool established_ = false;
    bool waitingNoted_ = false;
    bool quitting_ = false;

    std::mutex postedMutex_;
    std::vector<std::function<void()>> posted_; // guarded by postedMutex_
};

const pw_registry_events PipeWireAdapter::Impl::kRegistryEvents = {
    .version = PW_VERSION_REGISTRY_EVENTS, .global = onGlobal, .global_remove = onGlobalRemoved};

const pw_core_events PipeWireAdapter::Impl::kCoreEvents = {.version = PW_VERSION_CORE_EVENTS,
                                                           .info = nullptr,
                                                           .done = nullptr,
                                                           .ping = nullptr,
                                                           .error = onCoreError,
                                                           .remove_id = nullptr,
                                                           .bound_id = nullptr,
                                                           .add_mem = nullptr,
                                                           .remove_mem = nullptr};

PipeWireAdapter::Impl::Impl(Options options, GraphListener listener)
    : options_(std::move(options)), outside_(std::move(listener)),
      listener_([this](const GraphEvent& event) { tell(event); }), nextRetry_(options_.firstRetry) {
    pw_init(nullptr, nullptr);
    loop_ = pw_loop_new(nullptr);
    if (loop_ == nullptr) {
        throw std::runtime_error("PipeWire gives no event loop: is its SPA library installed?");
    }
    context_ = pw_context_new(loop_, nullptr, 0);
    settleTimer_ = pw_loop_add_timer(loop_, onSettled, this);
    retryTimer_ = pw_loop_add_timer(loop_, onRetry, this);
    postedEvent_ = pw_loop_add_event(loop_, onPosted, this);
    tickTimer_ = pw_loop_add_timer(loop_, onTick, this);
    if (context_ == nullptr || settleTimer_ == nullptr || retryTimer_ == nullptr ||
        postedEvent_ == nullptr || tickTimer_ == nullptr) {
        throw std::runtime_error("PipeWire gives no context: is its configuration installed?");
    }
    // What the profiler says can only be read with its module on this side as well.
    if (options_.cycle && raw::loadModule(context_, PW_EXTENSION_MODULE_PROFILER) == nullptr) {
        note("cannot read PipeWire's profiler: glitches are not seen");
    }
    pw_loop_enter(loop_);
    setTimer(retryTimer_, std::chrono::nanoseconds(1));
}

PipeWireAdapter::Impl::~Impl() {
    disconnect();
    pw_loop_leave(loop_);
    pw_context_destroy(context_);
    pw_loop_destroy(loop_);
    pw_deinit();
}

void PipeWireAdapter::Impl::iterate(int timeoutMs) {
    pw_loop_iterate(loop_, timeoutMs);
}

void PipeWireAdapter::Impl::post(std::function<void()> work) {
    {
        const std::lock_guard lock(postedMutex_);
        posted_.push_back(std::move(work));
    }
    pw_loop_signal_event(loop_, postedEvent_);
}

void PipeWireAdapter::Impl::every(std::chrono::milliseconds period, std::function<void()> work) {
    tick_ = std::move(work);
    timespec value = toTimespec(period);
    timespec interval = value;
    pw_loop_update_timer(loop_, tickTimer_, &value, &interval, false);
}

void PipeWireAdapter::Impl::onTick(void* data, std::uint64_t) {
    // A copy: the work may ask for another.
    if (const auto work = static_cast<Impl*>(data)->tick_) {
        work();
    }
}

void PipeWireAdapter::Impl::onPosted(void* data, std::uint64_t) {
    auto& self = *static_cast<Impl*>(data);
    std::vector<std::function<void()>> work;
    {
        const std::lock_guard lock(self.postedMutex_);
        work.swap(self.posted_);
    }
    for (const auto& piece : work) {
        piece();
    }
}

void PipeWireAdapter::Impl::quitOnSignal(int signal) {
    pw_loop_add_signal(loop_, signal, onSignal, this);
}

void PipeWireAdapter::Impl::onSignal(void* data, int) {
    static_cast<Impl*>(data)->quitting_ = true;
}

void PipeWireAdapter::Impl::note(const std::string& text) const {
    if (options_.note) {
        options_.note(text);
    }
}

void PipeWireAdapter::Impl::setTimer(spa_source* timer, std::chrono::nanoseconds delay) {
    timespec value = toTimespec(delay);
    timespec once{};
    pw_loop_update_timer(loop_, timer, &value, &once, false);
}

// ---- The connection

void PipeWireAdapter::Impl::connect() {
    pw_properties* const properties = pw_properties_new(PW_KEY_APP_NAME, "halyard-pipewire",
                                                        PW_KEY_MEDIA_CATEGORY, "Manager", nullptr);
    if (!options_.remote.empty()) {
        pw_properties_set(properties, PW_KEY_REMOTE_NAME, options_.remote.c_str());
    }
    core_ = pw_context_connect(context_, properties, 0);
    if (core_ == nullptr) {
        lost(std::strerror(errno));
        return;
    }
    raw::listen(core_, &coreHook_, &kCoreEvents, this);
    registry_ = pw_core_get_registry(core_, PW_VERSION_REGISTRY, 0);
    raw::listen(registry_, &registryHook_, &kRegistryEvents, this);
    established_ = false;
}

void PipeWireAdapter::Impl::disconnect() {
    objects_.clear();
    burstBegan_.reset();
    if (core_ == nullptr) {
        return;
    }
    spa_hook_remove(&registryHook_);
    spa_hook_remove(&coreHook_);
    pw_proxy_destroy(reinterpret_cast<pw_proxy*>(std::exchange(registry_, nullptr)));
    pw_core_disconnect(std::exchange(core_, nullptr));
}

void PipeWireAdapter::Impl::lost(const char* reason) {
    if (!std::exchange(waitingNoted_, true)) {
        note(std::string("waiting for PipeWire: ") + reason);
    }
    retryLater();
}

// Only a daemon that tells of its objects counts: one that refuses us after the
// connection would have us try again without a pause.
void PipeWireAdapter::Impl::established() {
    if (!std::exchange(established_, true)) {
        note("connected to PipeWire");
        waitingNoted_ = false;
        nextRetry_ = options_.firstRetry;
    }
}

void PipeWireAdapter::Impl::retryLater() {
    setTimer(retryTimer_, nextRetry_);
    nextRetry_ = std::min(nextRetry_ * 2, options_.lastRetry);
}

void PipeWireAdapter::Impl::onRetry(void* data, std::uint64_t) {
    auto& self = *static_cast<Impl*>(data);
    // Here, not in the error callback: the core must not go while it calls us.
    if (self.core_ != nullptr) {
        self.disconnect();
        self.outside_(Disconnected{});
    }
    self.connect();
}

void PipeWireAdapter::Impl::onCoreError(void* data, std::uint32_t id, int, int result,
                                        const char*) {
    // Errors of other objects are theirs, such as a parameter that a node lacks.
    if (id == PW_ID_CORE && result == -EPIPE) {
        static_cast<Impl*>(data)->lost(spa_strerror(result));
    }
}

// ---- The graph

template <class Object, class... More>
void PipeWireAdapter::Impl::bind(ObjectId id, const char* type, std::uint32_t version,
                                 const More&... more) {
    auto* const proxy = static_cast<pw_proxy*>(pw_registry_bind(registry_, id, type, version, 0));
    if (proxy != nullptr) {
        objects_[id] = std::make_unique<Object>(id, proxy, listener_, more...);
    }
}

void PipeWireAdapter::Impl::onGlobal(void* data, ObjectId id, std::uint32_t, const char* type,
                                     std::uint32_t version, const spa_dict* properties) {
    auto& self = *static_cast<Impl*>(data);
    self.established();
    const std::string_view kind = type;
    if (kind == PW_TYPE_INTERFACE_Node && isWatched(readProperties(properties))) {
        self.bind<BoundNode>(id, type, PW_VERSION_NODE);
    } else if (kind == PW_TYPE_INTERFACE_Client) {
        self.bind<BoundClient>(id, type, PW_VERSION_CLIENT);
    } else if (kind == PW_TYPE_INTERFACE_Profiler && self.options_.cycle) {
        self.bind<BoundProfiler>(id, type, std::min<std::uint32_t>(version, PW_VERSION_PROFILER),
                                 self.options_.cycle);
    } else if (kind == PW_TYPE_INTERFACE_Link) {
        const auto from = objectId(properties, PW_KEY_LINK_OUTPUT_NODE);
        const auto to = objectId(properties, PW_KEY_LINK_INPUT_NODE);
        if (from && to) {
            self.tell(LinkAdded{id, *from, *to});
        }
    }
}

void PipeWireAdapter::Impl::onGlobalRemoved(void* data, ObjectId id) {
    auto& self = *static_cast<Impl*>(data);
    self.objects_.erase(id);
    self.tell(ObjectRemoved{id});
}

void PipeWireAdapter::Impl::tell(const GraphEvent& event) {
    outside_(event);
    const Clock::time_point now = Clock::now();
    if (!burstBegan_) {
        burstBegan_ = now;
    }
    const auto left = *burstBegan_ + options_.longestBurst - now;
    const auto delay = std::min<std::chrono::nanoseconds>(left, options_.quiet);
    setTimer(settleTimer_, std::max(delay, std::chrono::nanoseconds(1)));
}

void PipeWireAdapter::Impl::onSettled(void* data, std::uint64_t) {
    auto& self = *static_cast<Impl*>(data);
    if (std::exchange(self.burstBegan_, std::nullopt)) {
        self.outside_(Settled{});
    }
}

// ---- The outside

PipeWireAdapter::PipeWireAdapter(Options options, GraphListener listener)
    : impl_(std::make_unique<Impl>(std::move(options), std::move(listener))) {}

PipeWireAdapter::~PipeWireAdapter() = default;

void PipeWireAdapter::run() {
    while (!impl_->quitting()) {
        impl_->iterate(-1);
    }
}

void PipeWireAdapter::iterate(std::chrono::milliseconds timeout) {
    impl_->iterate(static_cast<int>(timeout.count()));
}

void PipeWireAdapter::post(std::function<void()> work) {
    impl_->post(std::move(work));
}

void PipeWireAdapter::every(std::chrono::milliseconds period, std::function<void()> work) {
    impl_->every(period, std::move(work));
}

void PipeWireAdapter::quitOnSignal(int signal) {
    impl_->quitOnSignal(signal);
}

bool PipeWireAdapter::connected() const {
    return impl_->connected();
}

} // namespace halyard::pipewire
