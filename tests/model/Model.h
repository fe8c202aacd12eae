// A model of the library: a table in memory, and operations with the names and arguments of the library's.
// Nothing of the library is used here, and no SQL.
//
// Operations do not change arguments that they only read. They throw Json::LogicError where the library does:
// when a value cannot be converted.

#ifndef TESTS_MODEL_H
#define TESTS_MODEL_H

#include "ModelRow.h"

struct ModelRules {
    int checkJsonType(Json::Value& jToken);
    int fillDefaultValue(Json::Value& jToken, bool blCheck);
    int checkPermission(Json::Value& jToken, const char* szWebapiName, const char* szWebapiMethod);
};

class ModelStore {
public:
    int tokenSave(Json::Value& jRecord, bool blCreate);
    int tokenGet(Json::Value& jFilter, Json::Value& jTokenArrayOut);
    int tokenGetOne(const char* szName, std::string& strValue, Json::Value& jTokenOut);
    int tokenDelete(Json::Value& jFilter, bool blAll);
    int cleanExpireToken(bool blLog);

    // In the order of the table: sorted by when they were last written.
    const std::vector<Row>& rows() const { return m_rows; }

private:
    std::vector<Row> m_rows;
};

class ModelService {
public:
    explicit ModelService(ModelStore& store) : m_store(store) {}

    // Tells the model the id that the library has generated; it must look like one.
    void setGenerated(const std::string& strTid);
    int tokenGenerate(std::string& strTidOut);

    int tokenCreateByTid(unsigned int& uid, std::string& strFunction, Json::Value& jTokenOption,
                         std::string& strTidIn);
    int tokenCreate(unsigned int& uid, std::string& strFunction, Json::Value& jTokenOption,
                    std::string& strTidOut);
    int tokenList(Json::Value& jFilter, Json::Value& jTokenArrayOut);
    int tokenGetByTid(std::string& strTid, Json::Value& jTokenOut);
    int VectorParamToJson(std::vector<std::string>& strVector, const char* szField, Json::Value& jParamOut);
    int tokenGetByTidArray(std::vector<std::string>& strTidVector, Json::Value& jTokenArrayOut);
    int tokenUpdateByTid(std::string& strTid, Json::Value& jParam);
    int tokenSaveByOverwrite(Json::Value& jToken);
    int tokenDeleteByArray(std::vector<std::string>& strVector, const char* szName);
    int tokenDeleteByName(std::string& strValue, const char* szName);
    int tokenDeleteByTid(std::string& strTid) { return tokenDeleteByName(strTid, "tid"); }
    int tokenDeleteByBindSid(std::string& strSid) { return tokenDeleteByName(strSid, "bind_sid"); }
    int tokenDeleteByFunction(std::string& strFunction) { return tokenDeleteByName(strFunction, "function"); }
    int tokenDeleteByTidArray(std::vector<std::string>& strTids)
    {
        return tokenDeleteByArray(strTids, "tid");
    }
    int tokenDeleteAll();
    int cleanExpireToken(bool blLogErr) { return m_store.cleanExpireToken(blLogErr); }
    int tokenGrant(std::string& strTid, const char* szWebapiName, const char* szWebapiMethod,
                   Json::Value& jTokenOut);
    int tokenCountDegrade(Json::Value& jToken);

private:
    ModelStore& m_store;
    std::string m_strGenerated;
};

// The exported functions. All of them purge first, except the deletion by session.
class ModelFunctions {
public:
    explicit ModelFunctions(ModelService& service) : m_service(service) {}

    int create(unsigned int& uid, std::string& strFunction, Json::Value& jTokenOption, std::string& strTid)
    {
        return purged().tokenCreate(uid, strFunction, jTokenOption, strTid);
    }
    int createByTid(unsigned int& uid, std::string& strFunction, Json::Value& jTokenOption,
                    std::string& strTid)
    {
        return purged().tokenCreateByTid(uid, strFunction, jTokenOption, strTid);
    }
    int generate(std::string& strTid) { return m_service.tokenGenerate(strTid); }
    int grantEx(std::string& strTid, const char* szWebapiName, const char* szWebapiMethod,
                Json::Value& jToken)
    {
        return purged().tokenGrant(strTid, szWebapiName, szWebapiMethod, jToken);
    }
    int grant(std::string& strTid, const char* szWebapiName, const char* szWebapiMethod, char* szUser,
              size_t cbUser);
    int deleteByTid(std::string& strTid) { return purged().tokenDeleteByTid(strTid); }
    int deleteByBindSid(const char* szSid)
    {
        std::string strSid = szSid ? szSid : "";
        return m_service.tokenDeleteByBindSid(strSid);
    }
    int deleteByFunction(std::string& strFunction) { return purged().tokenDeleteByFunction(strFunction); }

private:
    ModelService& purged()
    {
        m_service.cleanExpireToken(false);
        return m_service;
    }

    ModelService& m_service;
};

struct Model {
    ModelRules rules;
    ModelStore store;
    ModelService service{store};
    ModelFunctions functions{service};
};

#endif
