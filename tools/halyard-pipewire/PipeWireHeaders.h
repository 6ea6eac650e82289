// libpipewire's headers, whose inline functions and macros do not meet our
// warnings; the macros that we use, as functions.
#pragma once

#include <cstdint>

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wpedantic"
#pragma GCC diagnostic ignored "-Wconversion"
#pragma GCC diagnostic ignored "-Wold-style-cast"
#pragma GCC diagnostic ignored "-Wshadow"
#include <pipewire/pipewire.h>
#include <spa/debug/types.h>
#include <spa/param/audio/format-utils.h>
#include <spa/param/audio/type-info.h>
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

} // namespace halyard::pipewire::raw
#pragma GCC diagnostic pop
