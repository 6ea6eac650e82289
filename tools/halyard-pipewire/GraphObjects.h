// The objects of a PipeWire daemon that the adapter listens to, each for as long
// as it lives; what they tell becomes graph events.
//
// Runs on the loop's thread, like the adapter that owns them.
#pragma once

#include "GraphEvents.h"
#include "PipeWireHeaders.h"
#include "ProfileReader.h"

namespace halyard::pipewire {

class BoundObject {
public:
    // Takes `proxy` over; borrows `listener`.
    BoundObject(ObjectId id, pw_proxy* proxy, const GraphListener& listener);
    virtual ~BoundObject();
    BoundObject(const BoundObject&) = delete;
    BoundObject& operator=(const BoundObject&) = delete;

protected:
    const ObjectId id_;
    pw_proxy* const proxy_;
    const GraphListener& listener_;
    spa_hook hook_{};
};

class BoundClient final : public BoundObject {
public:
    BoundClient(ObjectId id, pw_proxy* proxy, const GraphListener& listener);

private:
    static void onInfo(void* data, const pw_client_info* info);
    static const pw_client_events kEvents;
};

// A node: its properties, state, volume and format.
class BoundNode final : public BoundObject {
public:
    BoundNode(ObjectId id, pw_proxy* proxy, const GraphListener& listener);

private:
    void askForChanged(const pw_node_info& info);
    void updateVolume(const spa_pod* props);
    static void onInfo(void* data, const pw_node_info* info);
    static void onParam(void* data, int sequence, std::uint32_t id, std::uint32_t index,
                        std::uint32_t next, const spa_pod* param);
    static const pw_node_events kEvents;

    std::uint32_t propsFlags_ = 0;
    std::uint32_t formatFlags_ = 0;
    float linearVolume_ = 1;
    bool muted_ = false;
};

// What the daemon tells of each cycle of each driver. Requires that the module of the
// profiler is loaded on this side.
class BoundProfiler final : public BoundObject {
public:
    // Borrows `cycles` as well.
    BoundProfiler(ObjectId id, pw_proxy* proxy, const GraphListener& listener,
                  const CycleListener& cycles);

private:
    static void onProfile(void* data, const spa_pod* portion);
    static const pw_profiler_events kEvents;

    const CycleListener& cycles_;
};

} // namespace halyard::pipewire
