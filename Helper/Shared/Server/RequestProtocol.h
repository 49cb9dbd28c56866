// The request protocol: 24 routines on each client's private port.
//
// A handler receives the port on which its request arrived and the fields of the request; its
// result is the return code of the reply. The folder that owns a handler defines it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>

#include "Helper/Shared/Server/MigSubsystem.h"
#include "Helper/Shared/Server/RequestFields.h"

using platform::kern_return_t;
using platform::mach_port_t;

// handlers/voicemail
kern_return_t server_LFMobileHelperSetVoicemailToken(mach_port_t port, String256& token);
kern_return_t server_LFMobileHelperSetVoicemailTokenForKey(mach_port_t port,
                                                           String256& key,
                                                           String256& token);
kern_return_t server_LFMobileHelperClearVoicemailToken(mach_port_t port);
kern_return_t server_LFMobileHelperRemoveAllVoicemailRecords(mach_port_t port);
kern_return_t server_LFMobileHelperCopyVoicemailTokenForKey(mach_port_t port,
                                                            String256& key,
                                                            OutString<256>& token);
kern_return_t server_LFMobileHelperCopyVoicemailToken(mach_port_t port, OutString<256>& token);
kern_return_t server_LFMobileHelperIsVoicemailSubscribed(mach_port_t port,
                                                         std::int32_t& isSubscribed);

// handlers/carrier
kern_return_t server_LFMobileHelperSetPreferenceValue(mach_port_t port,
                                                      String256& domain,
                                                      String256& key,
                                                      std::span<const std::byte> value);
kern_return_t server_LFMobileHelperCopyPreferenceValue(mach_port_t port,
                                                       String256& domain,
                                                       String256& key,
                                                       OutOfLineData& value);
kern_return_t server_LFMobileHelperCopyAppPreferenceValue(mach_port_t port,
                                                          String256& domain,
                                                          String256& key,
                                                          OutOfLineData& value);
kern_return_t server_LFMobileHelperLinkCarrierBundle(mach_port_t port,
                                                     String1024& target,
                                                     String1024& linkPath,
                                                     String1024& domain);
kern_return_t server_LFMobileHelperCreateSymlink(mach_port_t port,
                                                 String1024& target,
                                                 String1024& linkPath);
kern_return_t server_LFMobileHelperRemovePreferenceDomain(mach_port_t port,
                                                          String1024& path,
                                                          String1024& domain);

// heartbeat
kern_return_t server_LFMobileHelperSetHeartbeatEnabled(mach_port_t port, std::int32_t isEnabled);
kern_return_t server_LFMobileHelperSetRadioManagerLogging(mach_port_t port, std::int32_t isEnabled);

// lasd
kern_return_t server_LFMobileHelperCheckForDatabaseUpdate(mach_port_t port, std::int32_t types);

// handlers/files
kern_return_t server_LFMobileHelperCopyFile(mach_port_t port,
                                            String256& sourceDirectory,
                                            String256& destinationDirectory,
                                            String256& name,
                                            std::int32_t& isDone);
kern_return_t server_LFMobileHelperCopyLogDirectory(mach_port_t port,
                                                    String256& source,
                                                    std::int32_t& isDone);
kern_return_t server_LFMobileHelperMoveDirectory(mach_port_t port,
                                                 String256& source,
                                                 String256& destinationDirectory,
                                                 String256& name,
                                                 std::int32_t& isDone);
kern_return_t server_LFMobileHelperCopyArchive(mach_port_t port,
                                               String256& source,
                                               String256& destination,
                                               std::int32_t& isDone);
kern_return_t server_LFMobileHelperLoadPlistFile(mach_port_t port,
                                                 String256& path,
                                                 OutOfLineData& data);

// location
kern_return_t server_LFMobileHelperRequestCountryCodeFromLocation(mach_port_t port,
                                                                  double latitude,
                                                                  double longitude);
kern_return_t server_LFMobileHelperCopyCountryCode(mach_port_t port, OutString<64>& countryCode);
kern_return_t server_LFMobileHelperRequestWanIPFromLocation(mach_port_t port);

/// The subsystem that is attached to every client's private port.
extern const MigSubsystem kRequestSubsystem;
