/* Command language of the MAA test shell.
 *
 * Only the automaton is taken from bison: maa_tables.py turns its --xml report
 * into MAA_Parser_Tables.cpp. Rules appear in the order of their numbers in the
 * shell (rule N here is rule N there); bison's rule 0 ($accept) is the shell's
 * rule 90. The marker non-terminals stand for the shell's mid-rule actions
 * $@0, $@6 and $@65. Symbol numbers are assigned by the converter, by name.
 */
%expect 0

%token IDENTIFIER CONSTANT STRING
%token GE LE EQ NE PE ME TE DE RE AE OE EXE LSE RSE PP MM LS RS LOR LAND
%token R_CHAR R_SHORT R_LONG R_INT

%start statements

%%

statements
    : statement
    | statements ';' statement
    ;

statement
    : %empty
    | mark_0 expression
    ;

primary_expression
    : IDENTIFIER
    | CONSTANT
    | STRING
    | '(' expression ')'
    ;

postfix_expression
    : primary_expression
    | postfix_expression '(' ')'
    | postfix_expression '(' mark_6 argument_expression_list ')'
    | postfix_expression postfix_operator
    ;

postfix_operator
    : PP
    | MM
    ;

argument_expression_list
    : assignment_expression
    | argument_expression_list ',' assignment_expression
    ;

unary_expression
    : postfix_expression
    | PP unary_expression
    | MM unary_expression
    | unary_operator cast_expression
    ;

unary_operator
    : '&'
    | '*'
    | '+'
    | '-'
    | '~'
    | '!'
    ;

cast_expression
    : unary_expression
    | cast_operator cast_expression
    ;

cast_operator
    : '(' R_CHAR ')'
    | '(' R_SHORT ')'
    | '(' R_INT ')'
    | '(' R_LONG ')'
    | '(' R_CHAR '*' ')'
    | '(' R_SHORT '*' ')'
    | '(' R_INT '*' ')'
    | '(' R_LONG '*' ')'
    ;

multiplicative_expression
    : cast_expression
    | multiplicative_expression multiplicative_operator cast_expression
    ;

multiplicative_operator
    : '*'
    | '/'
    | '%'
    ;

additive_expression
    : multiplicative_expression
    | additive_expression additive_operator multiplicative_expression
    ;

additive_operator
    : '+'
    | '-'
    ;

shift_expression
    : additive_expression
    | shift_expression shift_operator additive_expression
    ;

shift_operator
    : LS
    | RS
    ;

relatinal_expression
    : shift_expression
    | relatinal_expression relatinal_operator shift_expression
    ;

relatinal_operator
    : '<'
    | '>'
    | LE
    | GE
    ;

equality_expression
    : relatinal_expression
    | equality_expression equality_operator relatinal_expression
    ;

equality_operator
    : EQ
    | NE
    ;

AND_expression
    : equality_expression
    | AND_expression '&' equality_expression
    ;

XOR_expression
    : AND_expression
    | XOR_expression '^' AND_expression
    ;

OR_expression
    : XOR_expression
    | OR_expression '|' XOR_expression
    ;

LAND_expression
    : OR_expression
    | LAND_expression LAND OR_expression
    ;

LOR_expression
    : LAND_expression
    | LOR_expression LOR LAND_expression
    ;

conditional_expression
    : LOR_expression
    | LOR_expression '?' expression ':' conditional_expression
    ;

assignment_expression
    : conditional_expression
    | unary_expression assignment_operator assignment_expression
    ;

assignment_operator
    : '='
    | TE
    | DE
    | RE
    | PE
    | ME
    | LSE
    | RSE
    | AE
    | EXE
    | OE
    ;

expression
    : assignment_expression
    | expression ',' mark_65 assignment_expression
    ;

mark_0
    : %empty
    ;

mark_6
    : %empty
    ;

mark_65
    : %empty
    ;
