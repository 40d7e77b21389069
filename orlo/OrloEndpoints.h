// Where the store's servers are. The build chooses the hosts.
#ifndef VELTRA_ORLO_ORLO_ENDPOINTS_H
#define VELTRA_ORLO_ORLO_ENDPOINTS_H

constexpr const char* dataStoreURL = "https://" VELTRA_ORLO_DATA_STORE_HOST ":8443";
constexpr const char* certificateAuthorityURL = "https://" VELTRA_ORLO_CA_HOST ":8443";
constexpr const char* trustObjectURL = "http://" VELTRA_ORLO_CA_HOST ":8080/orlotrustobject";

#endif
