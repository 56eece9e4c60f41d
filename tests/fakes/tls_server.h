// A small real HTTPS server for tests: loopback, a port of its own, a certificate made in memory, scripted
// answers.
#pragma once

#include <arpa/inet.h>
#include <netinet/in.h>
#include <openssl/bio.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/ssl.h>
#include <openssl/x509v3.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdlib>
#include <functional>
#include <list>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <thread>
#include <utility>
#include <vector>

namespace veltrad {

// A certificate that vouches for itself, valid for `names` ("DNS:localhost,IP:127.0.0.1").
class TestCertificates {
 public:
  explicit TestCertificates(const std::string& names = "DNS:localhost,IP:127.0.0.1")
      : _key(EVP_EC_gen("P-256")), _certificate(X509_new()) {
    X509* made = _certificate.get();
    X509_set_version(made, X509_VERSION_3);
    ASN1_INTEGER_set(X509_get_serialNumber(made), 1);
    X509_gmtime_adj(X509_getm_notBefore(made), -3600);
    X509_gmtime_adj(X509_getm_notAfter(made), 24 * 3600);
    X509_set_pubkey(made, _key.get());
    X509_NAME* name = X509_get_subject_name(made);
    X509_NAME_add_entry_by_txt(name, "CN", MBSTRING_ASC, reinterpret_cast<const unsigned char*>("Test"), -1,
                               -1, 0);
    X509_set_issuer_name(made, name);
    X509_EXTENSION* extension = X509V3_EXT_conf_nid(nullptr, nullptr, NID_subject_alt_name, names.c_str());
    if (X509_add_ext(made, extension, -1) != 1 || X509_sign(made, _key.get(), EVP_sha256()) == 0)
      std::abort();
    X509_EXTENSION_free(extension);
  }

  std::string authorityPEM() const {
    const std::unique_ptr<BIO, decltype(&BIO_free)> memory(BIO_new(BIO_s_mem()), BIO_free);
    PEM_write_bio_X509(memory.get(), _certificate.get());
    char* text = nullptr;
    const long length = BIO_get_mem_data(memory.get(), &text);
    return {text, static_cast<std::size_t>(length)};
  }
  void use(SSL_CTX* context) const {
    if (SSL_CTX_use_certificate(context, _certificate.get()) != 1 ||
        SSL_CTX_use_PrivateKey(context, _key.get()) != 1)
      std::abort();
  }

 private:
  template <auto release>
  struct Release {
    void operator()(auto* object) const { release(object); }
  };
  const std::unique_ptr<EVP_PKEY, Release<EVP_PKEY_free>> _key;
  const std::unique_ptr<X509, Release<X509_free>> _certificate;
};

struct TLSRequest {
  std::string head;  // request line and headers as they came, with the empty line
  std::string body;
};

struct TLSAnswer {
  enum class Shape {
    whole,
    thenCloses,   // whole, without a word that the connection ends; it does
    cut,          // "Content-Length" is the body's, half of it comes, then the end
    hangUp,       // the end, without a byte
    silent,       // nothing until the server ends
    endless,      // a chunked body without end
    endlessHead,  // headers without end
  };
  int status = 200;
  std::vector<std::pair<std::string, std::string>> headers = {};
  std::string body = {};
  Shape shape = Shape::whole;
};

// One thread accepts, one more serves each connection; the script runs on the latter. Threads end with the
// object.
class TLSServer {
 public:
  using Script = std::function<TLSAnswer(const TLSRequest&)>;

  TLSServer(const TestCertificates& certificates, Script script) : _script(std::move(script)) {
    _context = SSL_CTX_new(TLS_server_method());
    certificates.use(_context);
    _listener = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t length = sizeof address;
    auto* generic = reinterpret_cast<sockaddr*>(&address);
    if (bind(_listener, generic, length) != 0 || listen(_listener, 128) != 0 ||
        getsockname(_listener, generic, &length) != 0) {
      std::abort();
    }
    _port = ntohs(address.sin_port);
    _acceptor = std::thread([this] { accept(); });
  }
  ~TLSServer() {
    {
      const std::lock_guard lock(_mutex);
      _ending = true;
      _changed.notify_all();
      for (const int fd : _open) shutdown(fd, SHUT_RDWR);
    }
    shutdown(_listener, SHUT_RDWR);
    _acceptor.join();
    for (std::thread& thread : _threads) thread.join();
    close(_listener);
    SSL_CTX_free(_context);
  }
  TLSServer(const TLSServer&) = delete;
  TLSServer& operator=(const TLSServer&) = delete;

  std::uint16_t port() const { return _port; }
  std::string url(const std::string& path = "/", const std::string& host = "127.0.0.1") const {
    return "https://" + host + ":" + std::to_string(_port) + path;
  }
  std::vector<TLSRequest> requests() const {
    const std::lock_guard lock(_mutex);
    return _requests;
  }
  // False when fewer came in time.
  bool waitForRequests(std::size_t count) const {
    std::unique_lock lock(_mutex);
    return _changed.wait_for(lock, std::chrono::seconds(20), [&] { return _requests.size() >= count; });
  }
  bool waitForAllClosed() const {
    std::unique_lock lock(_mutex);
    return _changed.wait_for(lock, std::chrono::seconds(20), [&] { return _open.empty(); });
  }
  bool waitForRefusedHandshake() const {
    std::unique_lock lock(_mutex);
    return _changed.wait_for(lock, std::chrono::seconds(20), [&] { return _refusedHandshakes > 0; });
  }
  std::size_t connections() const {
    const std::lock_guard lock(_mutex);
    return _connections;
  }
  // The most that were open at a time.
  std::size_t mostOpen() const {
    const std::lock_guard lock(_mutex);
    return _mostOpen;
  }
  std::size_t applicationBytes() const { return _applicationBytes; }

 private:
  void accept() {
    for (;;) {
      const int fd = accept4(_listener, nullptr, nullptr, SOCK_CLOEXEC);
      const std::lock_guard lock(_mutex);
      if (fd < 0 || _ending) {
        if (fd >= 0) close(fd);
        return;
      }
      _open.insert(fd);
      _mostOpen = std::max(_mostOpen, _open.size());
      ++_connections;
      _threads.emplace_back([this, fd] { serve(fd); });
    }
  }

  void serve(int fd) {
    SSL* tls = SSL_new(_context);
    SSL_set_fd(tls, fd);
    if (SSL_accept(tls) == 1) {
      std::string received;
      TLSRequest request;
      while (read(tls, received, request) && answer(tls, request)) {
      }
    } else {
      const std::lock_guard lock(_mutex);
      ++_refusedHandshakes;
      _changed.notify_all();
    }
    SSL_free(tls);
    const std::lock_guard lock(_mutex);
    _open.erase(fd);
    close(fd);
    _changed.notify_all();
  }

  // What a whole request takes out of `received`.
  bool read(SSL* tls, std::string& received, TLSRequest& request) {
    std::size_t end = std::string::npos, length = 0;
    while (true) {
      if (end == std::string::npos && (end = received.find("\r\n\r\n")) != std::string::npos) {
        end += 4;
        const std::size_t at = received.find("\r\nContent-Length: ");
        length = at < end ? std::strtoull(received.c_str() + at + 18, nullptr, 10) : 0;
      }
      if (end != std::string::npos && received.size() - end >= length) break;
      char bytes[16384];
      const int count = SSL_read(tls, bytes, sizeof bytes);
      if (count <= 0) return false;
      _applicationBytes += static_cast<std::size_t>(count);
      received.append(bytes, static_cast<std::size_t>(count));
    }
    request.head = received.substr(0, end);
    request.body = received.substr(end, length);
    received.erase(0, end + length);
    const std::lock_guard lock(_mutex);
    _requests.push_back(request);
    _changed.notify_all();
    return true;
  }

  static bool write(SSL* tls, const std::string& bytes) {
    return SSL_write(tls, bytes.data(), static_cast<int>(bytes.size())) > 0;
  }
  static bool writeForEver(SSL* tls, const std::string& bytes) {
    while (write(tls, bytes)) {
    }
    return false;
  }

  // False: the connection ends.
  bool answer(SSL* tls, const TLSRequest& request) {
    using Shape = TLSAnswer::Shape;
    const TLSAnswer answer = _script(request);
    std::string head = "HTTP/1.1 " + std::to_string(answer.status) + " Text\r\n";
    for (const auto& [name, value] : answer.headers) head += name + ": " + value + "\r\n";
    const std::string whole =
        head + "Content-Length: " + std::to_string(answer.body.size()) + "\r\n\r\n" + answer.body;
    switch (answer.shape) {
      case Shape::whole:
        return write(tls, whole);
      case Shape::thenCloses:
        write(tls, whole);
        SSL_shutdown(tls);
        return false;
      case Shape::cut:
        write(tls, whole.substr(0, whole.size() - answer.body.size() / 2));
        return false;
      case Shape::hangUp:
        return false;
      case Shape::silent: {
        std::unique_lock lock(_mutex);
        _changed.wait(lock, [this] { return _ending; });
        return false;
      }
      case Shape::endless:
        return write(tls, head + "Transfer-Encoding: chunked\r\n\r\n") &&
               writeForEver(tls, "400\r\n" + std::string(1024, 'x') + "\r\n");
      case Shape::endlessHead:
        return write(tls, head) && writeForEver(tls, "X-More: " + std::string(1000, 'x') + "\r\n");
    }
    return false;
  }

  const Script _script;
  SSL_CTX* _context;
  int _listener;
  std::uint16_t _port = 0;
  std::atomic<std::size_t> _applicationBytes{0};
  mutable std::mutex _mutex;
  mutable std::condition_variable _changed;
  std::vector<TLSRequest> _requests;
  std::set<int> _open;
  std::size_t _connections = 0;
  std::size_t _mostOpen = 0;
  std::size_t _refusedHandshakes = 0;
  bool _ending = false;
  std::list<std::thread> _threads;
  std::thread _acceptor;
};

}  // namespace veltrad
