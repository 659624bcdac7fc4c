// libFuzzer target: opening a PST read-only and reading every folder and
// message it lists, as "Save in Existing PST" and the tests do.
#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

#include "fuzz/memfd_database.h"
#include "mapi/pst/pst_store.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  using namespace tarnwell::mapi;
  static tarnwell::fuzz::MemfdDatabase file;
  std::unique_ptr<pst::PstStore> store;
  if (!pst::PstStore::Open(file.Write(data, size), false, &store).ok()) return 0;
  constexpr size_t kMaxFolders = 64;
  std::vector<pst::Nid> stack = {store->root_folder()};
  for (size_t seen = 0; !stack.empty() && seen < kMaxFolders; ++seen) {
    const pst::Nid folder = stack.back();
    stack.pop_back();
    for (pst::Nid message : store->Messages(folder)) {
      Message m;
      store->ReadMessage(message, &m);
    }
    for (const pst::FolderInfo& f : store->SubFolders(folder)) stack.push_back(f.nid);
  }
  return 0;
}
