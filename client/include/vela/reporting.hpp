// libvelareporting: reports an audio process's sessions to the Vela reporting service. C++20 over the C API of
// vela/reporting.h, which describes threads, order, lost connections and fork. Nothing here throws or allocates.
//
//     vela::reporting::Client client;
//     vela::reporting::Session session(client, 42);
//     session.setServiceType(1);
//     session.start();
//     session.sendMessage({{"sample_rate", 48000.0}, {"device", "Built-in"}}, category, type);
//
// Values and fields refer to the caller's memory, which is read during the call only.
#pragma once

#include <array>
#include <chrono>
#include <concepts>
#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <limits>
#include <optional>
#include <span>
#include <string_view>
#include <type_traits>
#include <utility>
#include <vela/reporting.h>

namespace vela::reporting {

using Status = VelaReportingStatus;
using Error = VelaReportingError;
using State = VelaReportingClientState;
using Reporter = VelaReportingReporter;

/// For a wait without an end.
inline constexpr std::chrono::milliseconds kForever{-1};

/// Never null.
inline const char* textOf(Status status) noexcept { return VelaReportingStatusText(status); }

/// Seconds since 1970-01-01 00:00:00 UTC.
struct Date {
    double seconds = 0;
};

struct Field;

/// A view of a value; the size and the layout of VelaReportingValue.
struct Value : VelaReportingValue {
    template <std::same_as<bool> Boolean>
    Value(Boolean boolean) noexcept : VelaReportingValue(VelaReportingBoolean(boolean)) {}
    template <std::signed_integral Integer>
    Value(Integer integer) noexcept : VelaReportingValue(VelaReportingInteger(integer)) {}
    /// Numbers that fit are signed integers, as they are from other programs.
    template <std::unsigned_integral Integer>
    requires(!std::same_as<Integer, bool>) Value(Integer integer)
    noexcept
        : VelaReportingValue(static_cast<std::uint64_t>(integer) >
                                     static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())
                                 ? VelaReportingUnsigned(integer)
                                 : VelaReportingInteger(static_cast<std::int64_t>(integer))) {}
    Value(double real) noexcept : VelaReportingValue(VelaReportingDouble(real)) {}
    Value(Date date) noexcept : VelaReportingValue(VelaReportingDate(date.seconds)) {}
    Value(std::string_view text) noexcept : VelaReportingValue(VelaReportingTextOfSize(text.data(), text.size())) {}
    Value(const char* text) noexcept : VelaReportingValue(VelaReportingText(text)) {}
    Value(std::span<const std::byte> data) noexcept : VelaReportingValue(VelaReportingData(data.data(), data.size())) {}
    Value(std::span<const Value> values) noexcept
        : VelaReportingValue(VelaReportingArray(values.data(), values.size())) {}
    Value(std::span<const Field> fields) noexcept;
};

/// A view of an entry; the size and the layout of VelaReportingField.
struct Field : VelaReportingField {
    Field(std::string_view name, Value content) noexcept : VelaReportingField{name.data(), name.size(), content} {}
};

static_assert(sizeof(Value) == sizeof(VelaReportingValue) && std::is_standard_layout_v<Value>);
static_assert(sizeof(Field) == sizeof(VelaReportingField) && std::is_standard_layout_v<Field>);

inline Value::Value(std::span<const Field> fields) noexcept
    : VelaReportingValue(VelaReportingDictionary(fields.data(), fields.size())) {}

/// Entries of a message or of a configuration, in braces or in a contiguous container.
class Fields {
public:
    Fields(std::initializer_list<Field> fields) noexcept : fields_(fields.begin(), fields.size()) {}
    Fields(std::span<const Field> fields) noexcept : fields_(fields) {}
    template <std::size_t kCount>
    Fields(const std::array<Field, kCount>& fields) noexcept : fields_(fields) {}

    const VelaReportingField* data() const noexcept { return fields_.data(); }
    std::size_t size() const noexcept { return fields_.size(); }

private:
    std::span<const Field> fields_;
};

/// The sessions that a message is for.
class ReporterIDs {
public:
    /// All active sessions, of every client.
    static ReporterIDs all() noexcept { return {}; }
    ReporterIDs(std::span<const std::int64_t> ids) noexcept
        : data_(ids.empty() ? &kNobody : ids.data()),
          size_(ids.size()) {}
    ReporterIDs(std::initializer_list<std::int64_t> ids) noexcept
        : ReporterIDs(std::span<const std::int64_t>(ids.begin(), ids.size())) {}

    const std::int64_t* data() const noexcept { return data_; }
    std::size_t size() const noexcept { return size_; }

private:
    static constexpr std::int64_t kNobody = 0; ///< an address that is not null, for a list without elements

    ReporterIDs() = default;

    const std::int64_t* data_ = nullptr;
    std::size_t size_ = 0;
};

struct Options {
    const char* address = nullptr;            ///< a D-Bus address; null: see vela/reporting.h
    std::size_t queueBytes = 0;               ///< 0: 1 MiB
    std::chrono::milliseconds patience{1000}; ///< how long the destructor waits for what is queued
};

/// A client. Thread-safe, except that its end, and being moved, must come after every other use; sessions refer to it
/// where it stands.
class Client {
public:
    /// Whether it came about tells `status()`; the calls of one that did not answer InvalidArgument.
    explicit Client(const Options& options = {}) noexcept {
        VelaReportingClientOptions plain{};
        plain.size = sizeof(plain);
        plain.address = options.address;
        plain.queueBytes = options.queueBytes;
        plain.flushMilliseconds = options.patience.count() == 0 ? -1 : milliseconds(options.patience);
        status_ = VelaReportingClientCreate(&plain, &client_);
    }
    Client(Client&& other) noexcept
        : client_(std::exchange(other.client_, nullptr)),
          status_(std::exchange(other.status_, VelaReportingStatusInvalidArgument)) {}
    Client& operator=(Client&& other) noexcept {
        std::swap(client_, other.client_);
        std::swap(status_, other.status_);
        return *this;
    }
    Client(const Client&) = delete;
    Client& operator=(const Client&) = delete;
    ~Client() { end(); }

    Status status() const noexcept { return status_; }
    explicit operator bool() const noexcept { return client_ != nullptr; }
    /// For the functions of the C API; null when there is none.
    VelaReportingClient* get() const noexcept { return client_; }

    /// What the destructor does, with its answer: Timeout when something queued was not passed on.
    Status end() noexcept {
        status_ = VelaReportingStatusInvalidArgument;
        return VelaReportingClientDestroy(std::exchange(client_, nullptr));
    }

    State state() const noexcept {
        State state{};
        state.size = sizeof(state);
        VelaReportingClientGetState(client_, &state);
        return state;
    }

    // Calls that do not wait.

    Status createReportingSession(std::int64_t reporterID) const noexcept {
        return VelaReportingCreateReportingSession(client_, reporterID);
    }
    Status setServiceType(std::uint16_t serviceType, std::int64_t reporterID) const noexcept {
        return VelaReportingSetServiceType(client_, serviceType, reporterID);
    }
    Status setConfiguration(const Fields& configuration, std::int64_t reporterID) const noexcept {
        return VelaReportingSetConfiguration(client_, configuration.data(), configuration.size(), reporterID);
    }
    Status startReportingSessionForID(std::int64_t reporterID) const noexcept {
        return VelaReportingStartReportingSessionForID(client_, reporterID);
    }
    Status sendMessage(const Fields& message, std::uint32_t category, std::uint16_t type,
                       const ReporterIDs& reporterIDs) const noexcept {
        return VelaReportingSendMessage(client_, message.data(), message.size(), category, type, reporterIDs.data(),
                                        reporterIDs.size());
    }
    Status stopReportingSessionForID(std::int64_t reporterID) const noexcept {
        return VelaReportingStopReportingSessionForID(client_, reporterID);
    }
    Status destroyReportingSession(std::int64_t reporterID) const noexcept {
        return VelaReportingDestroyReportingSession(client_, reporterID);
    }

    // The same with a wait for the reply. `error` may be null; its size need not be set.

    Status createReportingSession(std::int64_t reporterID, std::chrono::milliseconds timeout,
                                  Error* error = nullptr) const noexcept {
        return VelaReportingCreateReportingSessionAndWait(client_, reporterID, milliseconds(timeout), sized(error));
    }
    Status setServiceType(std::uint16_t serviceType, std::int64_t reporterID, std::chrono::milliseconds timeout,
                          Error* error = nullptr) const noexcept {
        return VelaReportingSetServiceTypeAndWait(client_, serviceType, reporterID, milliseconds(timeout),
                                                  sized(error));
    }
    Status setConfiguration(const Fields& configuration, std::int64_t reporterID, std::chrono::milliseconds timeout,
                            Error* error = nullptr) const noexcept {
        return VelaReportingSetConfigurationAndWait(client_, configuration.data(), configuration.size(), reporterID,
                                                    milliseconds(timeout), sized(error));
    }
    Status startReportingSessionForID(std::int64_t reporterID, std::chrono::milliseconds timeout,
                                      Error* error = nullptr) const noexcept {
        return VelaReportingStartReportingSessionForIDAndWait(client_, reporterID, milliseconds(timeout), sized(error));
    }
    Status sendMessage(const Fields& message, std::uint32_t category, std::uint16_t type,
                       const ReporterIDs& reporterIDs, std::chrono::milliseconds timeout,
                       Error* error = nullptr) const noexcept {
        return VelaReportingSendMessageAndWait(client_, message.data(), message.size(), category, type,
                                               reporterIDs.data(), reporterIDs.size(), milliseconds(timeout),
                                               sized(error));
    }
    Status stopReportingSessionForID(std::int64_t reporterID, std::chrono::milliseconds timeout,
                                     Error* error = nullptr) const noexcept {
        return VelaReportingStopReportingSessionForIDAndWait(client_, reporterID, milliseconds(timeout), sized(error));
    }
    Status destroyReportingSession(std::int64_t reporterID, std::chrono::milliseconds timeout,
                                   Error* error = nullptr) const noexcept {
        return VelaReportingDestroyReportingSessionAndWait(client_, reporterID, milliseconds(timeout), sized(error));
    }

    // Questions.

    /// 65535 for an unknown ID; none when the call was not Ok.
    std::optional<std::uint16_t> serviceTypeOf(std::int64_t reporterID, std::chrono::milliseconds timeout,
                                               Error* error = nullptr) const noexcept {
        std::uint16_t serviceType = 0;
        const Status status = VelaReportingGetServiceNameForReporterID(client_, reporterID, &serviceType,
                                                                       milliseconds(timeout), sized(error));
        return status == VelaReportingStatusOk ? std::optional(serviceType) : std::nullopt;
    }
    std::optional<Reporter> reporter(std::int64_t reporterID, std::chrono::milliseconds timeout,
                                     Error* error = nullptr) const noexcept {
        Reporter reporter{};
        const Status status =
            VelaReportingReporterID(client_, reporterID, &reporter, milliseconds(timeout), sized(error));
        return status == VelaReportingStatusOk ? std::optional(reporter) : std::nullopt;
    }
    /// Writes as many as `room` holds and answers how many there are.
    std::optional<std::size_t> allReporters(std::span<std::int64_t> room, std::chrono::milliseconds timeout,
                                            Error* error = nullptr) const noexcept {
        std::size_t count = 0;
        const Status status = VelaReportingGetAllReporters(client_, room.data(), room.size(), &count,
                                                           milliseconds(timeout), sized(error));
        return status == VelaReportingStatusOk ? std::optional(count) : std::nullopt;
    }
    Status killService(std::chrono::milliseconds timeout, Error* error = nullptr) const noexcept {
        return VelaReportingKillService(client_, milliseconds(timeout), sized(error));
    }

private:
    static std::int32_t milliseconds(std::chrono::milliseconds time) noexcept {
        constexpr std::int64_t kMost = std::numeric_limits<std::int32_t>::max();
        return time.count() > kMost ? static_cast<std::int32_t>(kMost)
                                    : static_cast<std::int32_t>(time.count() < 0 ? -1 : time.count());
    }
    static Error* sized(Error* error) noexcept {
        if (error != nullptr) {
            *error = {};
            error->size = sizeof(*error);
        }
        return error;
    }

    VelaReportingClient* client_ = nullptr;
    Status status_ = VelaReportingStatusInvalidArgument;
};

/// A session that is created with this object and destroyed with it. Nothing waits. Its client outlives it, where it
/// stands. Thread-safe like its client.
class Session {
public:
    Session(const Client& client, std::int64_t reporterID) noexcept
        : client_(client),
          reporterID_(reporterID),
          status_(client.createReportingSession(reporterID)) {}
    Session(const Session&) = delete;
    Session& operator=(const Session&) = delete;
    ~Session() { client_.destroyReportingSession(reporterID_); }

    /// What became of its creation.
    Status status() const noexcept { return status_; }
    std::int64_t reporterID() const noexcept { return reporterID_; }

    Status setServiceType(std::uint16_t serviceType) const noexcept {
        return client_.setServiceType(serviceType, reporterID_);
    }
    Status setConfiguration(const Fields& configuration) const noexcept {
        return client_.setConfiguration(configuration, reporterID_);
    }
    Status start() const noexcept { return client_.startReportingSessionForID(reporterID_); }
    /// To this session.
    Status sendMessage(const Fields& message, std::uint32_t category, std::uint16_t type) const noexcept {
        return client_.sendMessage(message, category, type, {reporterID_});
    }
    Status stop() const noexcept { return client_.stopReportingSessionForID(reporterID_); }

private:
    const Client& client_;
    std::int64_t reporterID_;
    Status status_;
};

} // namespace vela::reporting
