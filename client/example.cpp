// Reports one session of an audio process, in C++. Prints what became of it.
#include <iostream>
#include <vela/reporting.hpp>

int main() {
    using namespace std::chrono_literals;
    namespace reporting = vela::reporting;
    constexpr std::int64_t kReporterID = 4712;
    constexpr std::uint16_t kServiceType = 11;
    constexpr std::uint32_t kCategory = 1;
    constexpr std::uint16_t kType = 3;

    reporting::Client client;
    {
        const reporting::Session session(client, kReporterID);
        session.setServiceType(kServiceType);
        session.setConfiguration({{"HostApplicationDisplayID", "example.cpp"}});
        session.start();

        // Outside the audio thread one may wait: the session is known once this is answered.
        reporting::Error error{};
        const auto reporter = client.reporter(kReporterID, 5s, &error);
        if (!reporter) {
            std::cerr << "no answer: " << error.name << " " << error.text << "\n";
            return 1;
        }
        std::cout << "service type " << reporter->serviceType << "\n";

        // This may stand in the audio callback: it returns at once, whatever the service does.
        const reporting::Value channels[] = {"left", "right"};
        session.sendMessage({{"sample_rate", 48000.0},
                             {"frames", 512},
                             {"overload", false},
                             {"channels", std::span<const reporting::Value>(channels)}},
                            kCategory, kType);
        session.stop();
    }
    const auto dropped = client.state().droppedQueueFull;
    const reporting::Status status = client.end();
    std::cout << "dropped " << dropped << ", " << reporting::textOf(status) << "\n";
    return status == VelaReportingStatusOk ? 0 : 1;
}
