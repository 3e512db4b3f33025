// The files exchanged with a runner: the request reader (as a runner reads
// it) and the three result readers, all on the same input.
#include <stdexcept>
#include <string_view>

#include <hoxcm/plugins.h>

#include "fuzz/fuzz_support.h"

using namespace HoxConfigManager;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string path = hoxcm_fuzz::WriteInput("exchange.json", hoxcm_fuzz::Text(data, size));
  PluginRequest request;
  bool loaded = false;
  hoxcm_fuzz::Refusable([&] {
    request.Load(path);
    loaded = true;
  });
  // Each reader of the request on its own: a missing member the runner needs
  // is refused with a std::runtime_error that names it, as the runners
  // expect; anything else wrong with the library's exceptions.
  const auto read = [&](auto getter) {
    hoxcm_fuzz::Refusable([&] {
      try {
        getter();
      } catch (const HostCtl::Lib::HostCtlException&) {
        throw;
      } catch (const std::runtime_error& e) {
        hoxcm_fuzz::Check(std::string_view(e.what()).rfind("The PluginRequest structure does not contain ", 0) == 0,
                          "a request refused with an unknown text");
      }
    });
  };
  if (loaded) {
    read([&] { request.GetVersion(); });
    read([&] { request.GetType(); });
    read([&] { request.GetModule(); });
    read([&] { request.GetId(); });
    read([&] { request.GetTaskId(); });
    read([&] { request.GetClusterContext(); });
    read([&] { request.GetData(); });
    read([&] { request.GetReferences(); });
  }
  hoxcm_fuzz::Refusable([&] { ErrorInfo::Load(path).Serialize(); });
  hoxcm_fuzz::Refusable([&] { ImpactPluginResult::Load(path); });
  hoxcm_fuzz::Refusable([&] { ValidationPluginResult::Load(path); });
  return 0;
}
