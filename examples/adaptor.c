/* SPDX-License-Identifier: Apache-2.0 */
/* An adaptor bundle. It appends every message to var/log/veltrad/example-adaptor.jsonl under VELTRA_ROOT, as
 * one line {"method":…,"respCode":…,"dict":…}. docs/adaptor.md says where to install it. */
#define _GNU_SOURCE
#include <fcntl.h>
#include <math.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/types.h>
#include <unistd.h>
#include <veltra/adaptor.h>

static void put_string(FILE* out, const char* bytes, size_t count) {
  fputc('"', out);
  for (size_t i = 0; i < count; ++i) {
    const unsigned char byte = (unsigned char)bytes[i];
    if (byte < ' ' || byte == '"' || byte == '\\') {
      fprintf(out, "\\u%04x", byte);
    } else {
      fputc(byte, out);
    }
  }
  fputc('"', out);
}

static void put_base64(FILE* out, const unsigned char* bytes, size_t count) {
  static const char digits[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  for (size_t i = 0; i < count; i += 3) {
    const unsigned second = i + 1 < count ? bytes[i + 1] : 0;
    const unsigned third = i + 2 < count ? bytes[i + 2] : 0;
    const unsigned bits = (unsigned)bytes[i] << 16 | second << 8 | third;
    fputc(digits[bits >> 18], out);
    fputc(digits[bits >> 12 & 63], out);
    fputc(i + 1 < count ? digits[bits >> 6 & 63] : '=', out);
    fputc(i + 2 < count ? digits[bits & 63] : '=', out);
  }
}

static void put_value(FILE* out, const veltra_adaptor_value* value) {
  switch (value->type) {
    case VELTRA_ADAPTOR_BOOLEAN:
      fputs(value->as.boolean ? "true" : "false", out);
      break;
    case VELTRA_ADAPTOR_SIGNED:
      fprintf(out, "%lld", (long long)value->as.signed_integer);
      break;
    case VELTRA_ADAPTOR_UNSIGNED:
      fprintf(out, "%llu", (unsigned long long)value->as.unsigned_integer);
      break;
    case VELTRA_ADAPTOR_REAL:
      fprintf(out, isfinite(value->as.real) ? "%.17g" : "null", value->as.real);
      break;
    case VELTRA_ADAPTOR_STRING:
      put_string(out, value->as.string, value->count);
      break;
    case VELTRA_ADAPTOR_DATE:
      fprintf(out, "{\"$date\":%.17g}", value->as.real);
      break;
    case VELTRA_ADAPTOR_DATA:
      fputs("{\"$data\":\"", out);
      put_base64(out, value->as.data, value->count);
      fputs("\"}", out);
      break;
    case VELTRA_ADAPTOR_ARRAY:
      fputc('[', out);
      for (size_t i = 0; i < value->count; ++i) {
        if (i > 0) fputc(',', out);
        put_value(out, &value->as.items[i]);
      }
      fputc(']', out);
      break;
    case VELTRA_ADAPTOR_DICTIONARY:
      fputc('{', out);
      for (size_t i = 0; i < value->count; ++i) {
        const veltra_adaptor_entry* entry = &value->as.entries[i];
        if (i > 0) fputc(',', out);
        put_string(out, entry->key, entry->key_length);
        fputc(':', out);
        put_value(out, &entry->value);
      }
      fputc('}', out);
      break;
  }
}

/* The instance is the path of its file. */
static void* create(void) {
  const char* root = getenv("VELTRA_ROOT");
  char* path = NULL;
  if (asprintf(&path, "%s/var/log/veltrad/example-adaptor.jsonl", root ? root : "") < 0) return NULL;
  return path;
}

static void destroy(void* path) {
  free(path);
}

/* Each line is one write, because instances of other sessions write to the same file. */
static void send_message(void* path, uint16_t method, uint16_t resp_code, const veltra_adaptor_value* dict) {
  char* line = NULL;
  size_t length = 0;
  FILE* out = open_memstream(&line, &length);
  if (!out) return;
  fprintf(out, "{\"method\":%u,\"respCode\":%u,\"dict\":", method, resp_code);
  if (dict) {
    put_value(out, dict);
  } else {
    fputs("null", out);
  }
  fputs("}\n", out);
  const int file = open(path, O_WRONLY | O_APPEND | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0640);
  if (fclose(out) == 0 && file >= 0) {
    if (write(file, line, length) < 0) perror("example adaptor");
  }
  if (file >= 0) close(file);
  free(line);
}

static const veltra_adaptor_operation operations[] = {{VELTRA_ADAPTOR_SEND, send_message}};
static const veltra_adaptor_class classes[] = {{VELTRA_ADAPTOR_CLASS, create, destroy, 1, operations}};
const veltra_adaptor_bundle veltra_adaptor = {VELTRA_ADAPTOR_VERSION, 1, classes};
