// The sample tree of the indexing daemon's benchmark (fileindexd_bench.cpp):
// a deterministic corpus of files in nested folders, made from a fixed seed
// with std::mt19937_64 (whose output the standard fixes) and our own
// distributions, so that every machine gets the same tree.
//
// Folders: about one per 40 files, each below a random earlier one, at most
// five levels deep. Files: 78 % text (.txt, .log, .md, .html, .json, .csv;
// log-normal sizes around 3 KiB, at most 256 KiB), 22 % binaries (.pdf,
// .jpg, .mp3, .zip, .bin, .exe; random bytes, log-normal around 8 KiB). The
// text is made of pseudo-words built from syllables without the letters x,
// y and z, so words built from those never occur in it.
#pragma once

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <iterator>
#include <random>
#include <stdexcept>
#include <string>
#include <unordered_set>
#include <vector>

namespace vellis::bench {

class CorpusRandom {
 public:
  explicit CorpusRandom(uint64_t seed) : gen_(seed) {}
  // Uniform in [0, 1).
  double Uniform() { return static_cast<double>(gen_() >> 11) * 0x1.0p-53; }
  // Uniform in [0, n).
  size_t Below(size_t n) { return static_cast<size_t>(Uniform() * static_cast<double>(n)); }
  // Log-normal with median `median` and shape `sigma` (Box-Muller).
  double LogNormal(double median, double sigma) {
    const double u1 = 1.0 - Uniform(), u2 = Uniform();
    const double normal = std::sqrt(-2.0 * std::log(u1)) * std::cos(6.283185307179586 * u2);
    return median * std::exp(sigma * normal);
  }
  uint64_t Next() { return gen_(); }

 private:
  std::mt19937_64 gen_;
};

struct CorpusFile {
  std::string path;  // full path
  bool text = false;
};

struct Corpus {
  std::string root;                // the indexed folder (full path)
  std::vector<std::string> dirs;   // full paths, the root first
  std::vector<CorpusFile> files;   // in creation order
  std::vector<std::string> words;  // the vocabulary, most frequent first
  uint64_t bytes = 0;
};

// The vocabulary: `n` distinct pseudo-words of two to four syllables.
inline std::vector<std::string> MakeVocabulary(CorpusRandom& rnd, size_t n) {
  static const char* const kOnsets[] = {"b", "c",  "d",  "f",  "g",  "h",  "j",  "k",
                                        "l", "m",  "n",  "p",  "r",  "s",  "t",  "v",
                                        "w", "br", "cl", "dr", "gr", "pl", "st", "tr"};
  static const char* const kVowels[] = {"a", "e", "i", "o", "u", "ai", "ea", "ou"};
  static const char* const kCodas[] = {"", "", "", "n", "r", "s", "t", "l", "m", "nd"};
  std::vector<std::string> words;
  std::unordered_set<std::string> seen;
  while (words.size() < n) {
    std::string w;
    const size_t syllables = 2 + rnd.Below(3);
    for (size_t i = 0; i < syllables; ++i) {
      w += kOnsets[rnd.Below(std::size(kOnsets))];
      w += kVowels[rnd.Below(std::size(kVowels))];
      w += kCodas[rnd.Below(std::size(kCodas))];
    }
    if (seen.insert(w).second) words.push_back(w);
  }
  return words;
}

// A word with a skew toward the start of the vocabulary, as in real text.
inline const std::string& PickWord(CorpusRandom& rnd, const std::vector<std::string>& words) {
  const double u = rnd.Uniform();
  return words[static_cast<size_t>(u * u * u * static_cast<double>(words.size()))];
}

// `n` words joined by blanks.
inline std::string MakeWords(CorpusRandom& rnd, const std::vector<std::string>& words, size_t n) {
  std::string out;
  for (size_t i = 0; i < n; ++i) {
    if (i > 0) out += ' ';
    out += PickWord(rnd, words);
  }
  return out;
}

// About `size` bytes of lines of words.
inline std::string MakeText(CorpusRandom& rnd, const std::vector<std::string>& words, size_t size) {
  std::string out;
  out.reserve(size + 128);
  while (out.size() < size) out += MakeWords(rnd, words, 6 + rnd.Below(10)) + ".\n";
  return out;
}

// The content of a text file of type `ext`, about `size` bytes.
inline std::string MakeTextFile(CorpusRandom& rnd, const std::vector<std::string>& words,
                                const std::string& ext, size_t size) {
  if (ext == "html") {
    return "<!DOCTYPE html>\n<html><head><title>" + PickWord(rnd, words) +
           "</title></head>\n<body><p>\n" + MakeText(rnd, words, size) + "</p></body></html>\n";
  }
  if (ext == "json") {
    std::string out = "[\n";
    while (out.size() < size) {
      out += "  {\"id\": " + std::to_string(rnd.Below(1000000)) + ", \"name\": \"" +
             PickWord(rnd, words) + "\", \"note\": \"" + MakeWords(rnd, words, 8) + "\"},\n";
    }
    return out + "  {}\n]\n";
  }
  if (ext == "csv") {
    std::string out = "id,name,amount,comment\n";
    while (out.size() < size) {
      out += std::to_string(rnd.Below(100000)) + "," + PickWord(rnd, words) + "," +
             std::to_string(rnd.Below(10000)) + "." + std::to_string(rnd.Below(100)) + "," +
             PickWord(rnd, words) + " " + PickWord(rnd, words) + "\n";
    }
    return out;
  }
  if (ext == "md") return "# " + PickWord(rnd, words) + "\n\n" + MakeText(rnd, words, size);
  return MakeText(rnd, words, size);
}

inline void WriteWholeFile(const std::string& path, const std::string& data) {
  int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
  if (fd < 0) throw std::runtime_error("cannot create " + path);
  const bool ok = write(fd, data.data(), data.size()) == static_cast<ssize_t>(data.size());
  close(fd);
  if (!ok) throw std::runtime_error("cannot write " + path);
}

// Makes the corpus of `files` files below `root` (which must exist).
inline Corpus MakeCorpus(const std::string& root, size_t files, uint64_t seed) {
  static const char* const kDirWords[] = {"reports", "archive", "projects", "notes", "2019",
                                          "2020",    "2021",    "drafts",   "data",  "misc",
                                          "clients", "minutes", "exports",  "docs",  "old"};
  struct Kind {
    const char* ext;
    int percent;
    bool text;
  };
  static const Kind kKinds[] = {{"txt", 36, true}, {"log", 10, true}, {"md", 8, true},
                                {"html", 9, true}, {"json", 8, true}, {"csv", 7, true},
                                {"pdf", 4, false}, {"jpg", 5, false}, {"mp3", 3, false},
                                {"zip", 3, false}, {"bin", 4, false}, {"exe", 3, false}};
  CorpusRandom rnd(seed);
  Corpus c;
  c.root = root;
  c.words = MakeVocabulary(rnd, 4096);
  c.dirs.push_back(root);
  std::vector<int> depth = {0};
  const size_t ndirs = std::max<size_t>(1, files / 40);
  while (c.dirs.size() < ndirs) {
    const size_t parent = rnd.Below(c.dirs.size());
    if (depth[parent] >= 5) continue;
    const std::string dir = c.dirs[parent] + "/" + kDirWords[rnd.Below(std::size(kDirWords))] +
                            "_" + std::to_string(c.dirs.size());
    if (mkdir(dir.c_str(), 0755) != 0) throw std::runtime_error("cannot create " + dir);
    c.dirs.push_back(dir);
    depth.push_back(depth[parent] + 1);
  }
  for (size_t i = 0; i < files; ++i) {
    size_t pick = rnd.Below(100);
    const Kind* kind = &kKinds[0];
    for (const Kind& k : kKinds) {
      if (pick < static_cast<size_t>(k.percent)) {
        kind = &k;
        break;
      }
      pick -= k.percent;
    }
    CorpusFile f;
    f.text = kind->text;
    f.path = c.dirs[rnd.Below(c.dirs.size())] + "/" + PickWord(rnd, c.words) + "_" +
             std::to_string(i) + "." + kind->ext;
    std::string data;
    if (kind->text) {
      const double size = std::min(rnd.LogNormal(3072, 1.0), 256.0 * 1024);
      data = MakeTextFile(rnd, c.words, kind->ext, static_cast<size_t>(size));
    } else {
      const size_t size = static_cast<size_t>(std::min(rnd.LogNormal(8192, 1.2), 1024.0 * 1024));
      data.resize(size + 16);
      for (size_t at = 0; at < data.size(); at += 8) {
        const uint64_t r = rnd.Next();
        data.replace(at, std::min<size_t>(8, data.size() - at), reinterpret_cast<const char*>(&r),
                     std::min<size_t>(8, data.size() - at));
      }
      data[0] = '\0';  // never mistaken for text
    }
    WriteWholeFile(f.path, data);
    c.bytes += data.size();
    c.files.push_back(std::move(f));
  }
  return c;
}

// A word that the corpus text cannot hold: "zyx" followed by `n` in
// letters.
inline std::string MarkerWord(const std::string& stem, size_t n) {
  std::string w = "zyx" + stem;
  do {
    w += static_cast<char>('a' + n % 26);
    n /= 26;
  } while (n > 0);
  return w;
}

}  // namespace vellis::bench
