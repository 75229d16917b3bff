/// libiscsi, loaded when it is first called. Linked, it and the seven libraries that it needs would make every start of
/// a program 0.4 ms longer, and a request of the web API is a start of a program.
///
/// The functions have their own names here, and hide those of libiscsi's headers in namespace norvhost. Where the
/// library cannot be loaded, iscsi_create_context() gives null, as it does without memory, and nothing can be asked of
/// the others.
#pragma once

#include <iscsi/iscsi.h>
#include <iscsi/scsi-lowlevel.h>

namespace norvhost {

/// The function of this name, null when the library cannot be loaded, which is logged.
void *libIscsiFunction(const char *name);

template <class Function>
class LibIscsiFunction;

template <class Result, class... Arguments>
class LibIscsiFunction<Result(Arguments...)> {
public:
    constexpr explicit LibIscsiFunction(const char *name) : name(name) {}

    Result operator()(Arguments... arguments) const
    {
        const auto function = reinterpret_cast<Result (*)(Arguments...)>(libIscsiFunction(name));
        return function ? function(arguments...) : Result();
    }

private:
    const char *name;
};

inline constexpr LibIscsiFunction<decltype(::iscsi_connect_sync)> iscsi_connect_sync("iscsi_connect_sync");
inline constexpr LibIscsiFunction<decltype(::iscsi_create_context)> iscsi_create_context("iscsi_create_context");
inline constexpr LibIscsiFunction<decltype(::iscsi_destroy_context)> iscsi_destroy_context("iscsi_destroy_context");
inline constexpr LibIscsiFunction<decltype(::iscsi_disconnect)> iscsi_disconnect("iscsi_disconnect");
inline constexpr LibIscsiFunction<decltype(::iscsi_full_connect_async)>
    iscsi_full_connect_async("iscsi_full_connect_async");
inline constexpr LibIscsiFunction<decltype(::iscsi_get_error)> iscsi_get_error("iscsi_get_error");
inline constexpr LibIscsiFunction<decltype(::iscsi_get_fd)> iscsi_get_fd("iscsi_get_fd");
inline constexpr LibIscsiFunction<decltype(::iscsi_login_sync)> iscsi_login_sync("iscsi_login_sync");
inline constexpr LibIscsiFunction<decltype(::iscsi_logout_async)> iscsi_logout_async("iscsi_logout_async");
inline constexpr LibIscsiFunction<decltype(::iscsi_readcapacity16_task)>
    iscsi_readcapacity16_task("iscsi_readcapacity16_task");
inline constexpr LibIscsiFunction<decltype(::iscsi_service)> iscsi_service("iscsi_service");
inline constexpr LibIscsiFunction<decltype(::iscsi_set_header_digest)>
    iscsi_set_header_digest("iscsi_set_header_digest");
inline constexpr LibIscsiFunction<decltype(::iscsi_set_immediate_data)>
    iscsi_set_immediate_data("iscsi_set_immediate_data");
inline constexpr LibIscsiFunction<decltype(::iscsi_set_initial_r2t)> iscsi_set_initial_r2t("iscsi_set_initial_r2t");
inline constexpr LibIscsiFunction<decltype(::iscsi_set_initiator_username_pwd)>
    iscsi_set_initiator_username_pwd("iscsi_set_initiator_username_pwd");
inline constexpr LibIscsiFunction<decltype(::iscsi_set_noautoreconnect)>
    iscsi_set_noautoreconnect("iscsi_set_noautoreconnect");
inline constexpr LibIscsiFunction<decltype(::iscsi_set_session_type)> iscsi_set_session_type("iscsi_set_session_type");
inline constexpr LibIscsiFunction<decltype(::iscsi_set_target_username_pwd)>
    iscsi_set_target_username_pwd("iscsi_set_target_username_pwd");
inline constexpr LibIscsiFunction<decltype(::iscsi_set_targetname)> iscsi_set_targetname("iscsi_set_targetname");
inline constexpr LibIscsiFunction<decltype(::iscsi_set_tcp_keepalive)>
    iscsi_set_tcp_keepalive("iscsi_set_tcp_keepalive");
inline constexpr LibIscsiFunction<decltype(::iscsi_set_tcp_syncnt)> iscsi_set_tcp_syncnt("iscsi_set_tcp_syncnt");
inline constexpr LibIscsiFunction<decltype(::iscsi_set_timeout)> iscsi_set_timeout("iscsi_set_timeout");
inline constexpr LibIscsiFunction<decltype(::iscsi_synchronizecache16_task)>
    iscsi_synchronizecache16_task("iscsi_synchronizecache16_task");
inline constexpr LibIscsiFunction<decltype(::iscsi_unmap_task)> iscsi_unmap_task("iscsi_unmap_task");
inline constexpr LibIscsiFunction<decltype(::iscsi_which_events)> iscsi_which_events("iscsi_which_events");
inline constexpr LibIscsiFunction<decltype(::iscsi_write16_task)> iscsi_write16_task("iscsi_write16_task");
inline constexpr LibIscsiFunction<decltype(::scsi_datain_unmarshall)> scsi_datain_unmarshall("scsi_datain_unmarshall");
inline constexpr LibIscsiFunction<decltype(::scsi_free_scsi_task)> scsi_free_scsi_task("scsi_free_scsi_task");

} // namespace norvhost
