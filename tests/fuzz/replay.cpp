// Replays corpora without the fuzzing engine: every file of the directories given, whole and cut off after
// each of its bytes. Says on standard error how many inputs that were; an input that breaks a rule aborts.
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size);

namespace {

std::size_t replay(const std::filesystem::path &path) {
  std::ifstream file(path, std::ios::binary);
  const std::string input{std::istreambuf_iterator<char>(file), {}};
  for (std::size_t size = 0; size <= input.size(); ++size)
    LLVMFuzzerTestOneInput(reinterpret_cast<const std::uint8_t *>(input.data()), size);
  return input.size() + 1;
}

} // namespace

int main(int argc, char **argv) {
  std::size_t inputs = 0;
  for (int i = 1; i < argc; ++i)
    for (const auto &entry : std::filesystem::directory_iterator(argv[i]))
      inputs += replay(entry.path());
  fprintf(stderr, "%zu inputs\n", inputs);
  return inputs == 0 ? 1 : 0;
}
