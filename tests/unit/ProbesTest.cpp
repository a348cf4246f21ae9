#include "xtd/Probes.h"

#include <elf.h>
#include <gtest/gtest.h>

#include <cstring>
#include <filesystem>
#include <fstream>
#include <set>

extern "C" unsigned short xtd_request__input_semaphore;

namespace extora {
namespace {

std::string fileBytes(const char* path) {
  std::string bytes(std::filesystem::file_size(path), '\0');
  std::ifstream(path, std::fstream::binary).read(bytes.data(), static_cast<std::streamsize>(bytes.size()));
  return bytes;
}

template <typename T>
T at(const std::string& bytes, std::size_t offset) {
  T value;
  std::memcpy(&value, bytes.data() + offset, sizeof value);
  return value;
}

// The notes of this program that tracers read, each "provider:name arguments".
std::set<std::string> probeNotes() {
  const std::string program = fileBytes("/proc/self/exe");
  const auto header = at<Elf64_Ehdr>(program, 0);
  const auto section = [&](std::size_t i) { return at<Elf64_Shdr>(program, header.e_shoff + i * sizeof(Elf64_Shdr)); };
  const auto names = section(header.e_shstrndx).sh_offset;
  std::set<std::string> notes;
  for (std::size_t i = 0; i < header.e_shnum; ++i) {
    const auto here = section(i);
    if (std::strcmp(program.data() + names + here.sh_name, ".note.stapsdt") != 0) continue;
    for (auto offset = here.sh_offset; offset < here.sh_offset + here.sh_size;) {
      const auto note = at<Elf64_Nhdr>(program, offset);
      const auto description = offset + sizeof note + ((note.n_namesz + 3U) & ~3U);
      EXPECT_NE(at<std::uint64_t>(program, description + 16), 0U) << "a probe without a semaphore";
      const char* provider = program.data() + description + 24;
      const char* name = provider + std::strlen(provider) + 1;
      const char* arguments = name + std::strlen(name) + 1;
      std::string sizes;  // of the arguments, negative for signed ones, without the places
      for (const char* each = arguments; each != nullptr && *each != 0; each = std::strchr(each, ' ')) {
        each += *each == ' ' ? 1 : 0;
        sizes += " " + std::string(each, std::strchr(each, '@'));
      }
      notes.insert(std::string(provider) + ":" + name + sizes);
      offset = description + ((note.n_descsz + 3U) & ~3U);
    }
  }
  return notes;
}

TEST(Probes, AllAreInTheProgramWithTheirArguments) {
  auto notes = probeNotes();
  // The standard library has probes of its own.
  std::erase_if(notes, [](const auto& note) { return !note.starts_with("xtd:"); });
  EXPECT_EQ(notes, (std::set<std::string>{"xtd:client__new -4", "xtd:client__done -4", "xtd:request__input -4 8",
                                          "xtd:request -4 8", "xtd:request__output -4 8", "xtd:plugin__add 8",
                                          "xtd:plugin__remove 8 -4", "xtd:plugin__ready 8", "xtd:discover__raw 4",
                                          "xtd:db__load 8 8", "xtd:XTARInitialization__begin",
                                          "xtd:XTARInitialization__end"}));
}

}  // namespace
}  // namespace extora
