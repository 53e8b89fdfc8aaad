// A first client of the Keymaster TA, in plain C, with the TEE Client API and nothing else.
//
//     first_client FILE SIGNATURE PUBLIC_KEY
//
// asks the TA for its algorithms, has it make an RSA key, signs FILE with the key, and writes the signature and the
// public half of the key. The private half never leaves the TEE. Afterwards somebody who knows nothing of TEEs checks:
//
//     openssl dgst -sha256 -verify PUBLIC_KEY -keyform DER -signature SIGNATURE FILE
//
// Read it from the end: main tells the story, each function above it one step. A client for another TEE looks the same;
// only the name of the context differs.
//
// Built with the installed library:   cc -std=c11 first_client.c $(pkg-config --cflags --libs keymaster-tee-client)
#include <stdarg.h>
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <tee_client_api.h>

// --- What the TA publishes -------------------------------------------------------------------------------------------

// A TA is known by its UUID. This is fbacea43-f475-4df3-866f-76256aba994f.
static const TEEC_UUID keymaster_ta = {0xfbacea43, 0xf475, 0x4df3, {0x86, 0x6f, 0x76, 0x25, 0x6a, 0xba, 0x99, 0x4f}};

// Some of its commands. keymaster-protocol(7) has them all, with what goes in and out.
enum {
  COMMAND_COUNT_ALGORITHMS = 1,
  COMMAND_LIST_ALGORITHMS = 2,
  COMMAND_GENERATE_KEY = 13,
  COMMAND_BEGIN = 16,
  COMMAND_UPDATE = 17,
  COMMAND_FINISH = 18,
  COMMAND_EXPORT_KEY = 20
};

// What a key is and may do is a set of tags with values. The tag's first hexadecimal digit is the type of its value.
#define TAG_PURPOSE 0x20000001u              // enumeration, may be repeated
#define TAG_ALGORITHM 0x10000002u            // enumeration
#define TAG_KEY_SIZE 0x30000003u             // 32-bit number
#define TAG_DIGEST 0x20000005u               // enumeration, may be repeated
#define TAG_PADDING 0x20000006u              // enumeration, may be repeated
#define TAG_RSA_PUBLIC_EXPONENT 0x500000C8u  // 64-bit number
#define TAG_NO_AUTH_REQUIRED 0x700001F7u     // boolean

#define ALGORITHM_RSA 1u
#define PURPOSE_SIGN 2u
#define PADDING_PKCS1_SIGN 5u
#define DIGEST_SHA_256 4u

// A blob of an RSA-2048 key with these few tags, a signature and a public key all fit.
#define ANSWER_SIZE 4096u
// How much of the file goes into one update.
#define CHUNK_SIZE 65536u

// --- Failing ---------------------------------------------------------------------------------------------------------

// The example stops at the first failure. A program that goes on would release what it holds, in reverse order; what a
// client that dies held in the TEE is released by the TEE.
_Noreturn static void fail(const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  fputs("first_client: ", stderr);
  vfprintf(stderr, format, arguments);
  fputc('\n', stderr);
  va_end(arguments);
  exit(EXIT_FAILURE);
}

// --- Bytes of a request ----------------------------------------------------------------------------------------------

// A request body is put together front to back. All numbers are little-endian, whatever the machine.
typedef struct {
  uint8_t* bytes;
  size_t capacity;
  size_t size;
} body_t;

static void put_bytes(body_t* body, const void* bytes, size_t size) {
  if (size > body->capacity - body->size) fail("a request is larger than its buffer");
  if (size != 0) memcpy(body->bytes + body->size, bytes, size);
  body->size += size;
}

static void put_number(body_t* body, uint64_t number, int width) {
  for (int i = 0; i < width; ++i) {
    const uint8_t byte = (uint8_t)(number >> (8 * i));
    put_bytes(body, &byte, 1);
  }
}

// A field is its length in 32 bits and its bytes.
static void put_field(body_t* body, const void* bytes, size_t size) {
  put_number(body, size, 4);
  put_bytes(body, bytes, size);
}

static uint32_t read_number(const uint8_t* bytes) {
  return (uint32_t)bytes[0] | (uint32_t)bytes[1] << 8 | (uint32_t)bytes[2] << 16 | (uint32_t)bytes[3] << 24;
}

typedef struct {
  uint32_t tag;
  uint64_t value;
} parameter_t;

// A parameter set is a count and a record of 24 bytes for each: the tag, four bytes without a meaning, the value, and
// eight bytes that only tags with a byte string use.
static void put_parameters(body_t* body, const parameter_t* parameters, uint32_t count) {
  put_number(body, count, 4);
  for (uint32_t i = 0; i < count; ++i) {
    put_number(body, parameters[i].tag, 4);
    put_number(body, 0, 4);
    put_number(body, parameters[i].value, 8);
    put_number(body, 0, 8);
  }
}

// The same as a field: its length stands in front.
static void put_parameter_field(body_t* body, const parameter_t* parameters, uint32_t count) {
  put_number(body, 4 + 24 * (uint64_t)count, 4);
  put_parameters(body, parameters, count);
}

// --- One command -----------------------------------------------------------------------------------------------------

// A command has four slots. The Keymaster TA uses three: slot 0 carries two small numbers in and out, slot 1 the
// request body, slot 2 the response. Which of them a command has must be said in paramTypes, exactly.
//
// There are two levels of error, and a client looks at both. The result of the call says whether the request was
// carried out at all, with an origin that says who answered: this library, the way to the TEE, the TEE, or the TA. What
// became of the request is the Keymaster error in slot 0 a, as a signed number.
static void invoke(TEEC_Session* session, uint32_t command, const char* step, TEEC_Operation* operation) {
  uint32_t origin = 0;
  const TEEC_Result result = TEEC_InvokeCommand(session, command, operation, &origin);
  const int32_t error = (int32_t)operation->params[0].value.a;
  if (result != TEEC_SUCCESS) fail("%s: TEE result 0x%08x from origin %u", step, (unsigned)result, (unsigned)origin);
  if (error != 0) fail("%s: Keymaster error %d", step, (int)error);
}

// Most commands read a body and answer one. For bodies of this size temporary references are right: the memory is
// shared with the TEE for this call alone. Gives the size of the answer.
static size_t exchange(TEEC_Session* session, uint32_t command, const char* step, TEEC_Value* words,
                       const body_t* request, uint8_t* answer, size_t capacity) {
  TEEC_Operation operation = {0};
  operation.paramTypes = TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, TEEC_MEMREF_TEMP_INPUT, TEEC_MEMREF_TEMP_OUTPUT, TEEC_NONE);
  operation.params[0].value = *words;
  operation.params[1].tmpref.buffer = request->bytes;
  operation.params[1].tmpref.size = request->size;
  operation.params[2].tmpref.buffer = answer;
  operation.params[2].tmpref.size = capacity;
  invoke(session, command, step, &operation);
  *words = operation.params[0].value;
  return operation.params[2].tmpref.size;
}

// --- The steps -------------------------------------------------------------------------------------------------------

// A name chooses the TEE, such as "embedded:FOLDER" for a device of one's own in this process. NULL takes the name in
// the environment variable KEYMASTER_TEE, or the default one, and so leaves the choice to the user.
static void connect_to_tee(TEEC_Context* context) {
  const TEEC_Result result = TEEC_InitializeContext(NULL, context);
  if (result == TEEC_ERROR_BUSY) fail("another program runs the device: wait, or share it through the server");
  if (result != TEEC_SUCCESS) fail("no TEE: result 0x%08x (KEYMASTER_TRACE=error says why)", (unsigned)result);
}

// Opening a session loads the TA if it is not there. "Public" means that the client does not say who it is; another
// login method would have the TEE tell the TA its user, group or program.
static void open_session(TEEC_Context* context, TEEC_Session* session) {
  uint32_t origin = 0;
  const TEEC_Result result = TEEC_OpenSession(context, session, &keymaster_ta, TEEC_LOGIN_PUBLIC, NULL, NULL, &origin);
  if (result != TEEC_SUCCESS) fail("no session: result 0x%08x from origin %u", (unsigned)result, (unsigned)origin);
}

// Lists are asked for in two steps: how many there are, then as many 32-bit numbers in a buffer of exactly that size.
// These two commands answer no Keymaster error: slot 0 a of the first is the count.
static void show_algorithms(TEEC_Session* session) {
  TEEC_Operation count = {0};
  count.paramTypes = TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, TEEC_NONE, TEEC_NONE, TEEC_NONE);
  uint8_t list[4 * 16];
  TEEC_Result result = TEEC_InvokeCommand(session, COMMAND_COUNT_ALGORITHMS, &count, NULL);
  const uint32_t algorithms = count.params[0].value.a;
  if (result != TEEC_SUCCESS) fail("counting the algorithms: TEE result 0x%08x", (unsigned)result);
  if (algorithms > sizeof list / 4) fail("the TA has more algorithms than this example expects");

  TEEC_Operation operation = {0};
  operation.paramTypes = TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, TEEC_NONE, TEEC_MEMREF_TEMP_OUTPUT, TEEC_NONE);
  operation.params[2].tmpref.buffer = list;
  operation.params[2].tmpref.size = 4 * (size_t)algorithms;
  result = TEEC_InvokeCommand(session, COMMAND_LIST_ALGORITHMS, &operation, NULL);
  if (result != TEEC_SUCCESS) fail("listing the algorithms: TEE result 0x%08x", (unsigned)result);
  printf("algorithms:");
  for (uint32_t i = 0; i < algorithms; ++i) {
    printf(" %u", (unsigned)read_number(list + 4 * (size_t)i));
  }
  printf("\n");
}

// A key is described by what it is and what it may be used for. What comes back is the key, sealed by the TA: bytes to
// be kept in a file, which only this device opens. The TA itself keeps nothing.
static size_t generate_key(TEEC_Session* session, uint8_t* blob, size_t capacity) {
  static const parameter_t description[] = {
      {TAG_ALGORITHM, ALGORITHM_RSA}, {TAG_KEY_SIZE, 2048},         {TAG_RSA_PUBLIC_EXPONENT, 65537},
      {TAG_PURPOSE, PURPOSE_SIGN},    {TAG_DIGEST, DIGEST_SHA_256}, {TAG_PADDING, PADDING_PKCS1_SIGN},
      {TAG_NO_AUTH_REQUIRED, 1},
  };
  uint8_t bytes[512];
  body_t request = {bytes, sizeof bytes, 0};
  put_parameters(&request, description, sizeof description / sizeof *description);
  TEEC_Value words = {0, 0};
  return exchange(session, COMMAND_GENERATE_KEY, "generate_key", &words, &request, blob, capacity);
}

// The public half is a SubjectPublicKeyInfo in DER, which every other library reads.
static size_t export_key(TEEC_Session* session, const uint8_t* blob, size_t blob_size, uint8_t* out, size_t capacity) {
  uint8_t bytes[ANSWER_SIZE + 12];
  body_t request = {bytes, sizeof bytes, 0};
  put_field(&request, blob, blob_size);
  put_field(&request, NULL, 0);  // the application's id, for keys that are bound to one
  put_field(&request, NULL, 0);  // and its data
  TEEC_Value words = {0, 0};
  return exchange(session, COMMAND_EXPORT_KEY, "export_key", &words, &request, out, capacity);
}

// begin opens the blob for a purpose and answers a handle. From then on one of the TA's few places for operations is
// taken, until finish, abort (command 23) or the first failure.
static uint32_t begin(TEEC_Session* session, const uint8_t* blob, size_t blob_size) {
  static const parameter_t how[] = {{TAG_DIGEST, DIGEST_SHA_256}, {TAG_PADDING, PADDING_PKCS1_SIGN}};
  uint8_t bytes[ANSWER_SIZE + 64];
  uint8_t answer[64];
  body_t request = {bytes, sizeof bytes, 0};
  put_field(&request, blob, blob_size);
  put_parameter_field(&request, how, 2);
  TEEC_Value words = {PURPOSE_SIGN, 0};
  (void)exchange(session, COMMAND_BEGIN, "begin", &words, &request, answer, sizeof answer);
  return words.b;
}

// Data in bulk goes through memory that is shared with the TEE once and used for every call. The file is read straight
// into it, at the place where the request has its input, so that nothing is copied on the way.
static void update_with_file(TEEC_Context* context, TEEC_Session* session, uint32_t handle, FILE* file) {
  TEEC_SharedMemory shared = {0};
  shared.size = 4 + CHUNK_SIZE + 8;
  shared.flags = TEEC_MEM_INPUT;  // what the TEE may do with it: read
  const TEEC_Result result = TEEC_AllocateSharedMemory(context, &shared);
  if (result != TEEC_SUCCESS) fail("no shared memory: TEE result 0x%08x", (unsigned)result);
  uint8_t* const bytes = shared.buffer;

  for (;;) {
    const size_t size = fread(bytes + 4, 1, CHUNK_SIZE, file);
    if (size == 0) break;
    body_t length = {bytes, 4, 0};
    body_t parameters = {bytes + 4 + size, 8, 0};
    put_number(&length, size, 4);
    put_parameter_field(&parameters, NULL, 0);

    TEEC_Operation operation = {0};
    operation.paramTypes =
        TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, TEEC_MEMREF_PARTIAL_INPUT, TEEC_MEMREF_TEMP_OUTPUT, TEEC_NONE);
    operation.params[0].value.a = handle;
    operation.params[1].memref.parent = &shared;
    operation.params[1].memref.size = 4 + size + parameters.size;  // the part of it that this call uses
    invoke(session, COMMAND_UPDATE, "update", &operation);
    if (operation.params[0].value.b != size) fail("update: the TA did not take all of the input");
  }
  TEEC_ReleaseSharedMemory(&shared);
}

// finish ends the operation. Its answer is a field with the signature, and an empty parameter set.
static size_t finish(TEEC_Session* session, uint32_t handle, uint8_t* signature, size_t capacity) {
  uint8_t bytes[16];
  uint8_t answer[1024];
  body_t request = {bytes, sizeof bytes, 0};
  put_field(&request, NULL, 0);  // only verifying has an input here
  put_parameter_field(&request, NULL, 0);
  TEEC_Value words = {handle, 0};
  const size_t size = exchange(session, COMMAND_FINISH, "finish", &words, &request, answer, sizeof answer);
  const size_t length = size < 4 ? 0 : read_number(answer);
  if (size < 4 || length > size - 4 || length > capacity) fail("finish: the answer is not a signature");
  memcpy(signature, answer + 4, length);
  return length;
}

static void write_file(const char* name, const uint8_t* bytes, size_t size) {
  FILE* const file = fopen(name, "wb");
  if (file == NULL || fwrite(bytes, 1, size, file) != size || fclose(file) != 0) fail("%s can't be written", name);
  printf("%s: %zu bytes\n", name, size);
}

int main(int argc, char** argv) {
  if (argc != 4) fail("usage: first_client FILE SIGNATURE PUBLIC_KEY");
  FILE* const file = fopen(argv[1], "rb");
  if (file == NULL) fail("%s can't be read", argv[1]);

  TEEC_Context context;
  TEEC_Session session;
  connect_to_tee(&context);
  open_session(&context, &session);
  show_algorithms(&session);

  uint8_t blob[ANSWER_SIZE];
  uint8_t public_key[ANSWER_SIZE];
  uint8_t signature[512];
  const size_t blob_size = generate_key(&session, blob, sizeof blob);
  printf("a key, sealed: %zu bytes\n", blob_size);
  const size_t public_key_size = export_key(&session, blob, blob_size, public_key, sizeof public_key);

  const uint32_t handle = begin(&session, blob, blob_size);
  update_with_file(&context, &session, handle, file);
  if (ferror(file)) fail("%s can't be read to its end", argv[1]);
  const size_t signature_size = finish(&session, handle, signature, sizeof signature);

  // Sessions end before their context. The TA goes away with its last session; the blob would still be good.
  TEEC_CloseSession(&session);
  TEEC_FinalizeContext(&context);
  (void)fclose(file);
  write_file(argv[2], signature, signature_size);
  write_file(argv[3], public_key, public_key_size);
  return EXIT_SUCCESS;
}
