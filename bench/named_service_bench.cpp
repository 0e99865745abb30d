// The named service: small messages through its socket beside a bare transfer of the same frames,
// and one message with 10,000 records.
#include <benchmark/benchmark.h>
#include <stdlib.h>
#include <sys/socket.h>

#include <filesystem>
#include <thread>

#include "platform/linux/base/paths.h"
#include "platform/linux/base/services.h"
#include "platform/linux/service/frame_buffer.h"
#include "platform/linux/service/services.h"
#include "platform/linux/service/unix_socket.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr int kMessages = 100'000;

std::string FrameOf(const Dictionary& message) {
  return MakeFrame(std::get<std::string>(WriteXmlPropertyList(message)));
}

std::string SmallFrames() {
  const std::string frame = FrameOf({{"operation", Int64(5)}});
  std::string frames;
  for (int i = 0; i < kMessages; ++i) frames += frame;
  return frames;
}

// A service in a directory of its own that counts the messages it hears.
struct CountingService {
  CountingService() {
    std::string pattern = "/tmp/quorlet-bench-XXXXXX";
    directory = mkdtemp(pattern.data());
    service = MakeLinuxNamedService(Root(directory), *log);
    const bool listening = service->ListenNamedService("bench", [this](const ListenerEvent& event) {
      service->AcceptPeerConnection(*event.peer, [this](const PropertyValue&) { ++heard; });
    });
    if (!listening) abort();
  }
  ~CountingService() { std::filesystem::remove_all(directory); }
  void hear(const std::string& bytes, int messages) {
    heard = 0;
    std::thread sender([&] {
      const Descriptor peer = MakeUnixSocket();
      if (UnixSocketAddress(directory + kServiceDirectory, "bench").connect(peer.get()) != 0 ||
          WriteFully(peer.get(), bytes) != 0) {
        abort();
      }
    });
    while (heard < messages) service->RunMainLoop(1, true);
    sender.join();
  }

  std::string directory;
  std::unique_ptr<SystemLog> log = MakeStandardErrorLog();
  std::unique_ptr<NamedService> service;
  int heard = 0;
};

void BM_SmallMessages(benchmark::State& state) {
  CountingService service;
  const std::string frames = SmallFrames();
  for (auto _ : state) service.hear(frames, kMessages);
  state.SetItemsProcessed(state.iterations() * kMessages);
}
BENCHMARK(BM_SmallMessages)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_SmallMessagesBareSocketpair(benchmark::State& state) {
  const std::string frames = SmallFrames();
  std::string buffer(std::size_t{256} * 1024, '\0');
  for (auto _ : state) {
    int ends[2];
    if (socketpair(AF_UNIX, SOCK_STREAM, 0, ends) != 0) abort();
    const Descriptor reader(ends[0]);
    std::thread sender([&] {
      const Descriptor writer(ends[1]);
      if (WriteFully(writer.get(), frames) != 0) abort();
    });
    while (recv(reader.get(), buffer.data(), buffer.size(), 0) > 0) {
    }
    sender.join();
  }
  state.SetItemsProcessed(state.iterations() * kMessages);
}
BENCHMARK(BM_SmallMessagesBareSocketpair)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_AppInfoOf10000Records(benchmark::State& state) {
  CountingService service;
  Array records;
  for (int i = 0; i < 10'000; ++i) {
    records.push_back(Dictionary{{"uuid", Data(16)},
                                 {"bundle_id", "org.example.app" + std::to_string(i)},
                                 {"version", "1.2.3"},
                                 {"tesk_id", Int64(i)},
                                 {"arch", Int64(7)}});
  }
  const std::string frame = FrameOf({{"operation", Int64(2)}, {"app_data", records}});
  for (auto _ : state) service.hear(frame, 1);
  state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(frame.size()));
}
BENCHMARK(BM_AppInfoOf10000Records)->UseRealTime()->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace quorlet

BENCHMARK_MAIN();
