/* The C interface of libLinefoldGeocoder.so, which reads the answers of a server that speaks the
 * Nominatim reverse API. The daemon loads it with the first of them, since a JSON parser weighs
 * more than the rest of a look-up. No function throws.
 */
#ifndef LINEFOLD_GEOCODER_MODULE_H
#define LINEFOLD_GEOCODER_MODULE_H

#include <stddef.h>

#ifdef __cplusplus
#define LINEFOLD_GEOCODER_NOEXCEPT noexcept
extern "C" {
#else
#define LINEFOLD_GEOCODER_NOEXCEPT
#endif

typedef enum {
    LINEFOLD_GEOCODER_COUNTRY_CODE = 0, /* as the server spells it, which is in lower case */
    LINEFOLD_GEOCODER_STATE = 1,
    LINEFOLD_GEOCODER_CITY = 2,
    LINEFOLD_GEOCODER_POSTAL_CODE = 3,
    LINEFOLD_GEOCODER_ERROR = 4 /* why the server has no place */
} LinefoldGeocoderField;

typedef enum {
    LINEFOLD_GEOCODER_NO_ANSWER = 0, /* no JSON object: the server speaks something else */
    LINEFOLD_GEOCODER_REFUSED = 1,   /* an error, whose text, if it has one, was handed over */
    LINEFOLD_GEOCODER_NO_ADDRESS = 2,
    LINEFOLD_GEOCODER_ADDRESS = 3 /* what is known of it was handed over */
} LinefoldGeocoderResult;

/* Reads an answer, and hands each text that it finds over, UTF-8 and not empty, before it returns.
 */
__attribute__((visibility("default"))) LinefoldGeocoderResult LinefoldGeocoderRead(
    const void* body,
    size_t size,
    void* context,
    void (*take)(void* context, LinefoldGeocoderField field, const char* text, size_t size))
    LINEFOLD_GEOCODER_NOEXCEPT;

#ifdef __cplusplus
}
#endif

#endif
