// A playback stream of the test's own process, which unlike those of the command-line players can pause.
#pragma once

#include <array>
#include <cstdint>
#include <cstring>
#include <pipewire/pipewire.h>
#include <spa/param/audio/format-utils.h>
#include <string>

namespace vela::reporter {

class PausableStream {
public:
    PausableStream(const std::string& socket, const std::string& name) {
        pw_init(nullptr, nullptr);
        loop_ = pw_thread_loop_new("stream", nullptr);
        pw_thread_loop_lock(loop_);
        pw_thread_loop_start(loop_);
        events_.version = PW_VERSION_STREAM_EVENTS;
        events_.process = process;
        stream_ = pw_stream_new_simple(pw_thread_loop_get_loop(loop_), name.c_str(),
                                       pw_properties_new(PW_KEY_MEDIA_TYPE, "Audio", PW_KEY_MEDIA_CATEGORY, "Playback",
                                                         PW_KEY_MEDIA_ROLE, "Game", PW_KEY_NODE_NAME, name.c_str(),
                                                         PW_KEY_REMOTE_NAME, socket.c_str(), nullptr),
                                       &events_, this);
        std::array<std::uint8_t, 1024> room{};
        spa_pod_builder builder{};
        spa_pod_builder_init(&builder, room.data(), 1024);
        spa_audio_info_raw info{};
        info.format = SPA_AUDIO_FORMAT_F32;
        info.rate = 48000;
        info.channels = 2;
        const spa_pod* parameters[] = {spa_format_audio_raw_build(&builder, SPA_PARAM_EnumFormat, &info)};
        connected_ = pw_stream_connect(stream_, PW_DIRECTION_OUTPUT, PW_ID_ANY,
                                       static_cast<pw_stream_flags>(static_cast<unsigned>(PW_STREAM_FLAG_AUTOCONNECT) |
                                                                    static_cast<unsigned>(PW_STREAM_FLAG_MAP_BUFFERS)),
                                       parameters, 1) == 0;
        pw_thread_loop_unlock(loop_);
    }
    ~PausableStream() {
        pw_thread_loop_lock(loop_);
        pw_stream_destroy(stream_);
        pw_thread_loop_unlock(loop_);
        pw_thread_loop_stop(loop_);
        pw_thread_loop_destroy(loop_);
        pw_deinit();
    }
    PausableStream(const PausableStream&) = delete;
    PausableStream& operator=(const PausableStream&) = delete;

    bool isConnected() const { return connected_; }
    void setActive(bool active) {
        pw_thread_loop_lock(loop_);
        pw_stream_set_active(stream_, active);
        pw_thread_loop_unlock(loop_);
    }

private:
    /// Silence.
    static void process(void* data) {
        auto* const self = static_cast<PausableStream*>(data);
        pw_buffer* const buffer = pw_stream_dequeue_buffer(self->stream_);
        if (buffer == nullptr) {
            return;
        }
        spa_data& plane = buffer->buffer->datas[0];
        if (plane.data != nullptr) {
            constexpr std::uint32_t kFrame = 2 * sizeof(float);
            const std::uint32_t size = plane.maxsize / kFrame * kFrame;
            std::memset(plane.data, 0, size);
            plane.chunk->offset = 0;
            plane.chunk->stride = kFrame;
            plane.chunk->size = size;
        }
        pw_stream_queue_buffer(self->stream_, buffer);
    }

    pw_thread_loop* loop_ = nullptr;
    pw_stream* stream_ = nullptr;
    pw_stream_events events_{};
    bool connected_ = false;
};

} // namespace vela::reporter
