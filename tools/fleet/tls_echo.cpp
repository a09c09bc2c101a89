// A plain TLS echo, which is what a TLS library costs without a server around it: it accepts,
// shakes hands, sends back what came first, and closes, in a few threads that do nothing else.
#include <arpa/inet.h>
#include <gnutls/gnutls.h>
#include <netinet/tcp.h>
#include <sys/socket.h>
#include <unistd.h>

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <thread>

namespace {

void Serve(int listener, gnutls_certificate_credentials_t credentials) {
  for (;;) {
    const int connection = accept(listener, nullptr, nullptr);
    const int on = 1;
    setsockopt(connection, IPPROTO_TCP, TCP_NODELAY, &on, sizeof(on));
    gnutls_session_t session = nullptr;
    gnutls_init(&session, GNUTLS_SERVER);
    gnutls_set_default_priority(session);
    gnutls_credentials_set(session, GNUTLS_CRD_CERTIFICATE, credentials);
    gnutls_transport_set_int(session, connection);
    char block[4096];
    if (gnutls_handshake(session) == GNUTLS_E_SUCCESS) {
      const ssize_t size = gnutls_record_recv(session, block, sizeof(block));
      if (size > 0) {
        gnutls_record_send(session, block, static_cast<size_t>(size));
      }
      gnutls_bye(session, GNUTLS_SHUT_WR);
    }
    gnutls_deinit(session);
    close(connection);
  }
}

}  // namespace

// tls_echo PORT THREADS CERTIFICATE KEY
int main(int argc, char** argv) {
  if (argc != 5) {
    fprintf(stderr, "Usage: tls_echo PORT THREADS CERTIFICATE KEY\n");
    return 2;
  }
  signal(SIGPIPE, SIG_IGN);
  gnutls_certificate_credentials_t credentials = nullptr;
  gnutls_certificate_allocate_credentials(&credentials);
  if (gnutls_certificate_set_x509_key_file(credentials, argv[3], argv[4], GNUTLS_X509_FMT_PEM) <
      0) {
    fprintf(stderr, "tls_echo: no certificate\n");
    return 1;
  }
  sockaddr_in address = {};
  address.sin_family = AF_INET;
  address.sin_port = htons(static_cast<uint16_t>(strtol(argv[1], nullptr, 10)));
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  const int listener = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
  const int on = 1;
  setsockopt(listener, SOL_SOCKET, SO_REUSEADDR, &on, sizeof(on));
  if (bind(listener, reinterpret_cast<sockaddr*>(&address), sizeof(address)) != 0 ||
      listen(listener, SOMAXCONN) != 0) {
    perror("tls_echo");
    return 1;
  }
  for (int i = 1; i < strtol(argv[2], nullptr, 10); ++i) {
    std::thread(Serve, listener, credentials).detach();
  }
  Serve(listener, credentials);
}
