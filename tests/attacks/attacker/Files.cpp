// Of files and tokens. What was opened last is held, and what an act does with "it" it does with that file.
//
//   resolve STRING             has a document named, whose tokens it then has; prints its URL
//   token item|sibling         prints one of the tokens
//   open read|write            redeems the document's token
//   open-sibling read|write    the same for its hidden sibling
//   redeem TOKEN read|write    the same for any text
//   flip                       redeems the document's token with each one of its bits changed; prints what came of it, each once
//   cut                        the same with every beginning of the token
//   contents                   what it holds
//   write TEXT                 writes to it
//   reopen read|write          opens it again through the process's own descriptor
//   shrink                     truncates it through the same
//   link PATH                  gives it another name, by the descriptor; link-proc PATH: through the process's own descriptor
//   mode MODE                  gives it another mode, in octal digits
//   lease-it                   keeps others from opening it, as long as it is held
//   upgrade                    asks for writing through the descriptor, then writes
//   read PATH                  opens a path for reading
//   climb PATH                 the same, from the directory that the standard input is
//   make PATH                  makes a file, with its directories; symlink PATH TARGET: a symbolic link
//   node PATH                  makes a device
//   bind PATH PLACE            puts a file in another's place in a view of its own
//   extend URL CONSUMER        passes a document on
//   turn reading|writing URL   takes a turn at a file and gives it back; turn-with item|sibling ...: with one of the tokens
//   holders URL                asks who has a file
#include <fcntl.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <climits>
#include <cstring>
#include <filesystem>
#include <memory>
#include <set>
#include <utility>

#include "sdk/Consumer.h"
#include "tests/attacks/attacker/Acts.h"

namespace docuvend::attacker {
namespace {

constexpr std::size_t kMostContents = 4096;
constexpr unsigned kBitsOfAByte = 8;
constexpr mode_t kMode = 0600;

std::string text(const QXError& error) { return error.domain + " " + std::to_string(error.code); }
std::string text(const Failure& failure) { return failure ? text(*failure) : "ok"; }

QXURL urlOf(const std::string& text) { return QXURL::fromString(text).value_or(QXURL::fileURL("/", QXURLKind::directory)); }
Access accessOf(const std::string& word) { return word == "write" ? Access::readWrite : Access::read; }

class Hands {
 public:
  std::string resolve(const std::string& string) {
    if (!consumer()) return unreachable_;
    auto resolved = consumer_->documentURL(string);
    if (const auto* error = std::get_if<QXError>(&resolved)) return text(*error);
    document_ = std::get<Document>(std::move(resolved));
    return document_->url.absoluteString();
  }
  [[nodiscard]] std::optional<QXData> token(const std::string& which) const {
    if (!document_) return std::nullopt;
    return which == "sibling" ? document_->siblingToken : document_->itemToken;
  }
  std::string redeem(const QXData& token, const std::string& access) {
    if (!consumer()) return unreachable_;
    auto opened = consumer_->redeem(token, accessOf(access));
    if (const auto* error = std::get_if<QXError>(&opened)) return text(*error);
    file_ = std::get<QXDescriptor>(std::move(opened));
    return "ok";
  }
  std::string flip() {
    return outcomes([this](std::set<std::string>& found) {
      for (std::size_t bit = 0; bit < document_->itemToken->bytes.size() * kBitsOfAByte; ++bit) {
        QXData changed = *document_->itemToken;
        changed.bytes[bit / kBitsOfAByte] ^= static_cast<std::uint8_t>(1U << (bit % kBitsOfAByte));
        found.insert(redeem(changed, "read"));
      }
    });
  }
  std::string cut() {
    return outcomes([this](std::set<std::string>& found) {
      for (std::size_t length = 0; length < document_->itemToken->bytes.size(); ++length) {
        QXData shorter = *document_->itemToken;
        shorter.bytes.resize(length);
        found.insert(redeem(shorter, "read"));
      }
    });
  }
  std::string extend(const std::string& url, const std::string& to) {
    if (!consumer()) return unreachable_;
    const auto extended = consumer_->extendBookmark(urlOf(url), ConsumerID{to});
    const auto* error = std::get_if<QXError>(&extended);
    return error != nullptr ? text(*error) : std::get<std::string>(extended);
  }
  std::string turn(const std::string& kind, const std::string& url, std::optional<QXData> with) {
    if (!consumer()) return unreachable_;
    CoordinationOptions options;
    options.token = std::move(with);
    auto turn = kind == "writing" ? consumer_->coordinateWriting(urlOf(url), options) : consumer_->coordinateReading(urlOf(url), options);
    if (const auto* error = std::get_if<QXError>(&turn)) return text(*error);
    return text(std::get<CoordinatedAccess>(turn).end());
  }
  std::string holders(const std::string& url) {
    if (!consumer()) return unreachable_;
    const auto holders = consumer_->holders(urlOf(url));
    const auto* error = std::get_if<QXError>(&holders);
    return error != nullptr ? text(*error) : std::to_string(std::get<std::vector<FileHolder>>(holders).size());
  }
  [[nodiscard]] int held() const { return file_.number; }
  [[nodiscard]] std::string heldPath() const { return "/proc/self/fd/" + std::to_string(file_.number); }

 private:
  bool consumer() {
    if (consumer_) return true;
    auto connected = Consumer::connect({});
    if (const auto* error = std::get_if<QXError>(&connected)) {
      unreachable_ = text(*error);
      return false;
    }
    consumer_ = std::get<std::unique_ptr<Consumer>>(std::move(connected));
    return true;
  }
  template <class Trial>
  std::string outcomes(Trial trial) {
    if (!document_ || !document_->itemToken) return "no token";
    std::set<std::string> found;
    trial(found);
    std::string all;
    for (const std::string& outcome : found) all.append(all.empty() ? "" : ", ").append(outcome);
    return all;
  }

  std::unique_ptr<Consumer> consumer_;
  std::string unreachable_;
  std::optional<Document> document_;
  QXDescriptor file_{-1, nullptr};
};

std::string contents(int file) {
  std::array<char, kMostContents> bytes{};
  const ssize_t count = ::pread(file, bytes.data(), bytes.size(), 0);
  return count < 0 ? outcome(count) : std::string(bytes.data(), static_cast<std::size_t>(count));
}

std::string opened(int directory, const std::string& path, int flags) {
  const int file = ::openat(directory, path.c_str(), flags | O_CLOEXEC, kMode);
  const std::string result = outcome(file);
  if (file >= 0) ::close(file);
  return result;
}

std::string made(const std::string& path, const std::function<std::string()>& make) {
  std::error_code error;
  std::filesystem::create_directories(std::filesystem::absolute(path).parent_path(), error);
  if (error) return ::strerrorname_np(error.value());
  return make();
}

// Whoever may do this has a user namespace of its own, and may mount in it.
std::string bindOver(const std::string& path, const std::string& place) {
  if (::unshare(CLONE_NEWUSER | CLONE_NEWNS) != 0) return outcome(-1);
  return outcome(::mount(path.c_str(), place.c_str(), nullptr, MS_BIND, nullptr));
}

Acts tokenActs(const std::shared_ptr<Hands>& hands) {
  return {
      {"resolve", [hands](Words& words) { return hands->resolve(words.next()); }},
      {"token", [hands](Words& words) { return hands->token(words.next()).value_or(QXData{}).text(); }},
      {"open", [hands](Words& words) { return hands->redeem(hands->token("item").value_or(QXData{}), words.next()); }},
      {"open-sibling", [hands](Words& words) { return hands->redeem(hands->token("sibling").value_or(QXData{}), words.next()); }},
      {"redeem",
       [hands](Words& words) {
         const QXData token = QXData::fromText(words.next());
         return hands->redeem(token, words.next());
       }},
      {"flip", [hands](Words&) { return hands->flip(); }},
      {"cut", [hands](Words&) { return hands->cut(); }},
      {"extend",
       [hands](Words& words) {
         const std::string url = words.next();
         return hands->extend(url, words.next());
       }},
      {"turn",
       [hands](Words& words) {
         const std::string kind = words.next();
         return hands->turn(kind, words.next(), /*with=*/std::nullopt);
       }},
      {"turn-with",
       [hands](Words& words) {
         const auto token = hands->token(words.next());
         const std::string kind = words.next();
         return hands->turn(kind, words.next(), token);
       }},
      {"holders", [hands](Words& words) { return hands->holders(words.next()); }},
  };
}

Acts descriptorActs(const std::shared_ptr<Hands>& hands) {
  return {
      {"contents", [hands](Words&) { return contents(hands->held()); }},
      {"write",
       [hands](Words& words) {
         const std::string bytes = words.next();
         return outcome(::pwrite(hands->held(), bytes.data(), bytes.size(), 0));
       }},
      {"reopen",
       [hands](Words& words) {
         return opened(AT_FDCWD, hands->heldPath(), accessOf(words.next()) == Access::readWrite ? O_RDWR : O_RDONLY);
       }},
      {"shrink", [hands](Words&) { return outcome(::truncate(hands->heldPath().c_str(), 0)); }},
      {"link", [hands](Words& words) { return outcome(::linkat(hands->held(), "", AT_FDCWD, words.next().c_str(), AT_EMPTY_PATH)); }},
      {"link-proc",
       [hands](Words& words) {
         return outcome(::linkat(AT_FDCWD, hands->heldPath().c_str(), AT_FDCWD, words.next().c_str(), AT_SYMLINK_FOLLOW));
       }},
      {"mode", [hands](Words& words) { return outcome(::fchmod(hands->held(), std::stoul(words.next(), nullptr, 8))); }},
      {"lease-it", [hands](Words&) { return outcome(::fcntl(hands->held(), F_SETLEASE, F_WRLCK)); }},
      {"upgrade",
       [hands](Words&) {
         static_cast<void>(::fcntl(hands->held(), F_SETFL, O_RDWR));
         return outcome(::pwrite(hands->held(), "x", 1, 0));
       }},
      {"climb", [](Words& words) { return opened(STDIN_FILENO, words.next(), O_RDONLY); }},
  };
}

Acts pathActs() {
  return {
      {"read", [](Words& words) { return opened(AT_FDCWD, words.next(), O_RDONLY | O_NONBLOCK); }},
      {"make",
       [](Words& words) {
         const std::string path = words.next();
         return made(path, [&path] { return opened(AT_FDCWD, path, O_WRONLY | O_CREAT); });
       }},
      {"symlink",
       [](Words& words) {
         const std::string path = words.next();
         return made(path, [&path, &words] { return outcome(::symlink(words.next().c_str(), path.c_str())); });
       }},
      {"node", [](Words& words) { return outcome(::mknod(words.next().c_str(), S_IFCHR | kMode, makedev(1, 3))); }},
      {"bind",
       [](Words& words) {
         const std::string path = words.next();
         return bindOver(path, words.next());
       }},
  };
}

}  // namespace

Acts fileActs() {
  const auto hands = std::make_shared<Hands>();
  Acts acts = tokenActs(hands);
  acts.merge(descriptorActs(hands));
  acts.merge(pathActs());
  return acts;
}

}  // namespace docuvend::attacker
