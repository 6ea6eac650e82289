#include "GraphObjects.h"

#include <utility>

#include "NodeParams.h"

namespace halyard::pipewire {

BoundObject::BoundObject(ObjectId id, pw_proxy* proxy, const GraphListener& listener)
    : id_(id), proxy_(proxy), listener_(listener) {}

BoundObject::~BoundObject() {
    spa_hook_remove(&hook_);
    pw_proxy_destroy(proxy_);
}

// ---- Clients

const pw_client_events BoundClient::kEvents = {
    .version = PW_VERSION_CLIENT_EVENTS, .info = onInfo, .permissions = nullptr};

BoundClient::BoundClient(ObjectId id, pw_proxy* proxy, const GraphListener& listener)
    : BoundObject(id, proxy, listener) {
    pw_proxy_add_object_listener(proxy_, &hook_, &kEvents, this);
}

void BoundClient::onInfo(void* data, const pw_client_info* info) {
    const auto& self = *static_cast<BoundClient*>(data);
    if ((info->change_mask & PW_CLIENT_CHANGE_MASK_PROPS) != 0) {
        self.listener_(ClientChanged{self.id_, readProperties(info->props)});
    }
}

// ---- Nodes

const pw_node_events BoundNode::kEvents = {
    .version = PW_VERSION_NODE_EVENTS, .info = onInfo, .param = onParam};

BoundNode::BoundNode(ObjectId id, pw_proxy* proxy, const GraphListener& listener)
    : BoundObject(id, proxy, listener) {
    pw_proxy_add_object_listener(proxy_, &hook_, &kEvents, this);
}

void BoundNode::onInfo(void* data, const pw_node_info* info) {
    auto& self = *static_cast<BoundNode*>(data);
    if ((info->change_mask & PW_NODE_CHANGE_MASK_PROPS) != 0) {
        self.listener_(NodeChanged{self.id_, readProperties(info->props)});
    }
    if ((info->change_mask & PW_NODE_CHANGE_MASK_STATE) != 0) {
        const bool runs = info->state == PW_NODE_STATE_RUNNING;
        self.listener_(NodeStateChanged{self.id_, runs ? NodeState::Running : NodeState::Stopped});
    }
    if ((info->change_mask & PW_NODE_CHANGE_MASK_PARAMS) != 0) {
        self.askForChanged(*info);
    }
}

// A parameter's flags hold a bit that toggles when it changes. Asking for it then
// is surer than a subscription, which some versions serve only once.
void BoundNode::askForChanged(const pw_node_info& info) {
    for (std::uint32_t i = 0; i < info.n_params; ++i) {
        const spa_param_info& param = info.params[i];
        if (param.id != SPA_PARAM_Props && param.id != SPA_PARAM_Format) {
            continue;
        }
        std::uint32_t& known = param.id == SPA_PARAM_Props ? propsFlags_ : formatFlags_;
        const bool readable = (param.flags & SPA_PARAM_INFO_READ) != 0;
        if (std::exchange(known, param.flags) != param.flags && readable) {
            raw::enumerateParams(proxy_, param.id);
        }
    }
}

void BoundNode::onParam(void* data, int, std::uint32_t id, std::uint32_t, std::uint32_t,
                        const spa_pod* param) {
    auto& self = *static_cast<BoundNode*>(data);
    if (id == SPA_PARAM_Format) {
        self.listener_(NodeFormatChanged{self.id_, readFormat(param)});
    } else if (id == SPA_PARAM_Props) {
        self.updateVolume(param);
    }
}

void BoundNode::updateVolume(const spa_pod* props) {
    const VolumeUpdate update = readVolume(props);
    if (!update.linearVolume && !update.muted) {
        return;
    }
    linearVolume_ = update.linearVolume.value_or(linearVolume_);
    muted_ = update.muted.value_or(muted_);
    listener_(NodeVolumeChanged{id_, linearVolume_, muted_});
}

// ---- The profiler

const pw_profiler_events BoundProfiler::kEvents = {.version = PW_VERSION_PROFILER_EVENTS,
                                                   .profile = onProfile};

BoundProfiler::BoundProfiler(ObjectId id, pw_proxy* proxy, const GraphListener& listener,
                             const CycleListener& cycles)
    : BoundObject(id, proxy, listener), cycles_(cycles) {
    pw_proxy_add_object_listener(proxy_, &hook_, &kEvents, this);
}

void BoundProfiler::onProfile(void* data, const spa_pod* portion) {
    readProfile(portion, raw::sizeOf(portion), static_cast<BoundProfiler*>(data)->cycles_);
}

} // namespace halyard::pipewire
