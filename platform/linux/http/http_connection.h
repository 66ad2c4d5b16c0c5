// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "http/endpoint.h"
#include "http/transfer.h"
#include "ovraplatform/cred_errors.h"
#include "trust/certificate_verifier.h"

#include <ovrabase/connect.h>

#include <curl/curl.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace OvraPlatform {

using OvraBase::Deadline;

/// Bound on the body of a reply.
inline constexpr std::size_t kMaxReply = std::size_t{8} * 1024 * 1024;

/// What came back, with any status.
struct HttpAnswer {
    long status = 0;
    std::string body;
};

/// A file that travels with a request.
struct Upload {
    std::string path;
    std::string name; ///< its field name and file name in the form
};

/// One libcurl handle for one endpoint, with at most one connection. For one thread at a time.
///
/// HTTP 1.1 and TLS 1.2 or newer; no redirects, no proxy, no .netrc, nothing from the environment.
class HttpConnection {
public:
    enum class Purpose {
        kRequests, ///< the certificate is verified, the connection is kept
        /// As kRequests, but on the first connection the key of an unknown endpoint is pinned.
        kFirstContact,
        kProbe,   ///< the certificate is not checked; nothing secret may be sent
        kObserve, ///< the certificate is verified but passes anyway; nothing is sent
    };

    /// Null if there is no memory.
    [[nodiscard]] static std::unique_ptr<HttpConnection> open(const Endpoint &endpoint,
                                                              Purpose purpose);
    HttpConnection(const HttpConnection &) = delete;
    HttpConnection &operator=(const HttpConnection &) = delete;
    ~HttpConnection();

    /// The status of the answer to a GET, however much of the answer comes.
    [[nodiscard]] CredExpected<long> status(const std::string &url, Deadline deadline);
    /// \param body  application/x-www-form-urlencoded
    [[nodiscard]] CredExpected<HttpAnswer> post(const std::string &url, const std::string &body,
                                                Deadline deadline);
    /// Sends multipart/form-data: the fields, then the file.
    [[nodiscard]] CredExpected<HttpAnswer>
    postFile(const std::string &url, const std::vector<std::pair<std::string, std::string>> &fields,
             const Upload &upload, Deadline deadline);
    /// Connects, shakes hands, and sends nothing.
    [[nodiscard]] CredExpected<void> connectOnly(const std::string &url, Deadline deadline);

    const CertificateVerifier &verifier() const { return verifier_; }

private:
    /// One use of a connection, to tell whether it may be repeated on another one.
    struct Attempt {
        int count = 0;
        int socket = -1;
        std::optional<std::uint64_t> delivered; ///< bytes that had arrived when it began
        bool mayHaveArrived = false;            ///< something of the request
        bool endedInSilence = false;            ///< the peer fell silent
    };
    struct FreeHandle {
        void operator()(CURL *handle) const { curl_easy_cleanup(handle); }
    };
    struct FreeList {
        void operator()(curl_slist *list) const { curl_slist_free_all(list); }
    };

    HttpConnection(const Endpoint &endpoint, Purpose purpose);
    [[nodiscard]] bool setUp();
    [[nodiscard]] CredExpected<HttpAnswer> perform(const std::string &url, Deadline deadline);
    curl_socket_t connect();
    CredError errorOf(CURLcode code) const;
    CredError errorOfTransfer(CURLcode code) const;

    static std::size_t onBody(char *data, std::size_t size, std::size_t count, void *self);
    static std::size_t onHeader(char *data, std::size_t size, std::size_t count, void *self);
    static CURLcode onTlsContext(CURL *handle, void *context, void *self);
    static void onTlsEvent(const SSL *tls, int event, int value);
    static int onRequest(void *self, char *peer, char *local, int peerPort, int localPort);
    static curl_socket_t onOpenSocket(void *self, curlsocktype type, curl_sockaddr *address);
    static int onSocketOptions(void *self, curl_socket_t socket, curlsocktype type);
    static int onCloseSocket(void *self, curl_socket_t socket);

    bool isForRequests() const {
        return purpose_ == Purpose::kRequests || purpose_ == Purpose::kFirstContact;
    }

    Endpoint endpoint_;
    Purpose purpose_;
    CertificateVerifier verifier_;
    std::unique_ptr<curl_slist, FreeList> headers_;
    std::unique_ptr<curl_slist, FreeList> addresses_;
    HttpAnswer answer_;
    std::size_t headerBytes_ = 0;
    Attempt attempt_;
    int socket_ = -1;
    Deadline connectDeadline_;
    std::optional<CredError> notConnected_;
    bool replyTooLarge_ = false;
    bool tlsTooOld_ = false;
    bool endsWhenSilent_ = false; ///< the present socket has been told to
    // Last, so that they go first: closing a connection calls back.
    std::unique_ptr<CURL, FreeHandle> handle_;
    Transfer transfer_;
};

} // namespace OvraPlatform
