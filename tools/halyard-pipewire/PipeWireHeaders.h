// libpipewire's headers, whose inline functions and macros do not meet our
// warnings; the macros that we use, as functions.
#pragma once

#include <cstdint>

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wpedantic"
#pragma GCC diagnostic ignored "-Wconversion"
#pragma GCC diagnostic ignored "-Wold-style-cast"
#pragma GCC diagnostic ignored "-Wshadow"
#include <pipewire/extensions/profiler.h>
#include <pipewire/impl.h>
#include <pipewire/pipewire.h>
#include <spa/debug/types.h>
#include <spa/param/audio/format-utils.h>
#include <spa/param/audio/type-info.h>
#include <spa/param/profiler.h>
#include <spa/param/props.h>
#include <spa/pod/iter.h>
#include <spa/utils/result.h>

namespace halyard::pipewire::raw {

inline void listen(pw_core* core, spa_hook* hook, const pw_core_events* events, void* data) {
    pw_core_add_listener(core, hook, events, data);
}
inline void listen(pw_registry* registry, spa_hook* hook, const pw_registry_events* events,
                   void* data) {
    pw_registry_add_listener(registry, hook, events, data);
}
inline void enumerateParams(pw_proxy* node, std::uint32_t id) {
    pw_node_enum_params(reinterpret_cast<pw_node*>(node), 0, id, 0, UINT32_MAX, nullptr);
}
inline pw_impl_module* loadModule(pw_context* context, const char* name) {
    return pw_context_load_module(context, name, nullptr, nullptr);
}
inline std::uint64_t sizeOf(const spa_pod* pod) {
    return SPA_POD_SIZE(pod);
}
// The children of a struct.
template <class Visit> void forEachPod(const spa_pod* parent, Visit visit) {
    const auto* const body = static_cast<const spa_pod*>(SPA_POD_BODY_CONST(parent));
    const spa_pod* child = nullptr;
    SPA_POD_FOREACH(body, SPA_POD_BODY_SIZE(parent), child) {
        visit(child);
    }
}
// The properties of an object, by their keys.
template <class Visit> void forEachProperty(const spa_pod* pod, Visit visit) {
    if (!spa_pod_is_object(pod)) {
        return;
    }
    const auto* const object = reinterpret_cast<const spa_pod_object*>(pod);
    const spa_pod_prop* property = nullptr;
    SPA_POD_OBJECT_FOREACH(object, property) {
        visit(property->key, &property->value);
    }
}

} // namespace halyard::pipewire::raw
#pragma GCC diagnostic pop
